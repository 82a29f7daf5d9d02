// The errors by which an unreachable network mount shows itself, and the test that a path lies
// on a network mount. The test reads the mount table, not the path, so it answers for a mount
// whose server is gone; it is asked only after one of these errors, never per listed entry.
#pragma once
#include <errno.h>

#include "quib_fs.h"

namespace norvo {

// ENOENT, EIO, ENXIO and EHOSTDOWN: what a network file system answers when its server is gone.
inline bool IsUnreachableErrno(int err) {
    return err == ENOENT || err == EIO || err == ENXIO || err == EHOSTDOWN;
}

inline bool OnRemoteMount(const char *path) {
    return QUIBFSIsRemoteFS(QUIBFSIsInMountTable(path)) == 1;
}

}  // namespace norvo
