// The names the platform keeps for itself.
#include <string.h>

#include <gtest/gtest.h>

#include "quib_fs.h"

namespace {

// Walkers rely on these alone to skip the platform's own entries (and "." and "..").
TEST(HiddenNames, OnlyThePlatformsOwnNamesAreHidden) {
    for (const char *name : {".", "..", "@eaDir", "@tmp", "@sharebin", "#snapshot", ".DS_Store"}) {
        EXPECT_EQ(QUIBEAIsHiddenFile(name), 1) << name;
        EXPECT_EQ(QUIBEAIsHiddenDir(name), strcmp(name, "@eaDir") == 0 ? 1 : 0) << name;
    }
    for (const char *name : {static_cast<const char *>(nullptr), "", "...", "@eadir", "@eaDir2", "@eaDir/", "x@eaDir",
                             "@tmp/", " @tmp", "#recycle", ".ds_store", "a.txt", "@", "#", ".hidden", "\xff"}) {
        EXPECT_EQ(QUIBEAIsHiddenFile(name), 0) << (name ? name : "null");
        EXPECT_EQ(QUIBEAIsHiddenDir(name), 0) << (name ? name : "null");
    }
}

}  // namespace
