// WebUtils: what the web programs ask about the files they show.
#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <string>
#include <vector>

#include "api_guard.h"
#include "fs_path.h"
#include "mount_table.h"
#include "quib_webutils.h"

namespace norvo::platform {
namespace {

// Kernels before 5.8 don't report the mount-root mark: a mount root lies on another device
// than its parent, or is its own parent ("/").
bool DiffersFromParent(const std::string &path, const struct statx &self) {
    std::string parent;
    std::string_view last;
    if (!SplitLastComponent(path, &parent, &last)) {
        return true;
    }
    struct statx up;
    if (statx(AT_FDCWD, parent.c_str(), 0, STATX_INO, &up) != 0) {
        return false;
    }
    return up.stx_dev_major != self.stx_dev_major || up.stx_dev_minor != self.stx_dev_minor ||
           up.stx_ino == self.stx_ino;
}

// Whether the mount table lists path itself as a mount directory.
bool ListedAsMount(const std::string &path) {
    const std::string absolute = AbsolutePath(path.c_str());
    std::vector<MountEntry> entries;
    if (absolute.empty()) {
        QUIB_SET_ERRNO(errno);
        return false;
    }
    if (const int err = ReadMountTable(&entries)) {
        QUIB_SET_ERRNO(err);
        return false;
    }
    for (const MountEntry &entry : entries) {
        if (entry.dir == absolute) {
            return true;
        }
    }
    return false;
}

}  // namespace
}  // namespace norvo::platform

using namespace norvo::platform;

bool WebUtils::IsMountPoint(const std::string &path) {
    if (path.find('\0') != std::string::npos) {
        NORVO_FAIL_ERRNO(EINVAL);
        return false;
    }
    if (const int err = CheckPathArgument(path.c_str())) {
        NORVO_FAIL_ERRNO(err);
        return false;
    }
    return Guarded(false, [&] {
        struct statx self;
        if (statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, STATX_INO, &self) == 0) {
            if ((self.stx_attributes_mask & STATX_ATTR_MOUNT_ROOT) != 0) {
                return (self.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
            }
            return DiffersFromParent(path, self);
        }
        if (errno == ENOENT || errno == ENOTDIR) {
            return false;  // nothing there, so nothing mounted there
        }
        return ListedAsMount(path);
    });
}
