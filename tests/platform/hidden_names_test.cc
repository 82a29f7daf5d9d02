// The names the platform keeps for itself.
#include <gtest/gtest.h>

#include "quib_fs.h"

namespace {

TEST(HiddenNames, WalkersNeverSeeThePlatformsOwnEntries) {
    for (const char *name : {".", "..", "@eaDir", "@tmp", "@sharebin", "#snapshot", ".DS_Store"}) {
        EXPECT_EQ(QUIBEAIsHiddenFile(name), 1) << name;
    }
    for (const char *name : {"", "...", "@eadir", "@eaDir2", "x@eaDir", "@tmp/", " @tmp", "#recycle",
                             ".ds_store", "a.txt", "@", "#", ".hidden", "\xff"}) {
        EXPECT_EQ(QUIBEAIsHiddenFile(name), 0) << name;
    }
    EXPECT_EQ(QUIBEAIsHiddenFile(nullptr), 0);
}

TEST(HiddenNames, OnlyTheAttributeDirectoryIsAReservedDirectory) {
    EXPECT_EQ(QUIBEAIsHiddenDir("@eaDir"), 1);
    for (const char *name : {"@tmp", "@sharebin", ".", "..", "@eadir", "@eaDir/", ""}) {
        EXPECT_EQ(QUIBEAIsHiddenDir(name), 0) << name;
    }
    EXPECT_EQ(QUIBEAIsHiddenDir(nullptr), 0);
}

}  // namespace
