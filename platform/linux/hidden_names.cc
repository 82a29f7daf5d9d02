// Names the platform keeps for itself inside shares, which no listing or walk shows.
#include <string.h>

#include "quib_fs.h"

namespace {

// "." and ".." are here because walkers rely on this test alone to avoid looping.
constexpr const char *kHiddenNames[] = {
    ".",         "..",
    "@eaDir",     // extended attributes and thumbnails kept beside files
    "@tmp",       // a volume's scratch space
    "@sharebin",  // recycle bins kept by the platform outside the share tree
    "#snapshot",  // read-only snapshot views of a share
    ".DS_Store",  // folder metadata that Mac clients scatter over shares
};

}  // namespace

extern "C" {

int QUIBEAIsHiddenDir(const char *name) {
    return name != nullptr && strcmp(name, "@eaDir") == 0 ? 1 : 0;
}

int QUIBEAIsHiddenFile(const char *name) {
    // Every hidden name starts with one of these: most names are judged by their first byte.
    if (name == nullptr || (name[0] != '.' && name[0] != '@' && name[0] != '#')) {
        return 0;
    }
    for (const char *hidden : kHiddenNames) {
        if (strcmp(name, hidden) == 0) {
            return 1;
        }
    }
    return 0;
}

}  // extern "C"
