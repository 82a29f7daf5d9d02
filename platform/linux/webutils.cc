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

// The last (topmost) entry of the mount table whose directory is path itself, compared
// lexically, into *type; false when there is none, or with the slot set when the table or the
// working directory can't be read.
bool ListedAsMount(const std::string &path, std::string *type) {
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
    for (auto entry = entries.rbegin(); entry != entries.rend(); ++entry) {
        if (entry->dir == absolute) {
            *type = entry->type;
            return true;
        }
    }
    return false;
}

// 0 when path may be handed on; else the errno, with the slot set.
int CheckPathString(const std::string &path) {
    const int err = path.find('\0') != std::string::npos ? EINVAL : CheckPathArgument(path.c_str());
    if (err != 0) {
        NORVO_FAIL_ERRNO(err);
    }
    return err;
}

}  // namespace
}  // namespace norvo::platform

using namespace norvo::platform;

bool WebUtils::IsMountPoint(const std::string &path) {
    if (CheckPathString(path) != 0) {
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
        std::string type;
        return ListedAsMount(path, &type);
    });
}

std::string WebUtils::getMountType(const std::string &path) {
    if (CheckPathString(path) != 0) {
        return std::string();
    }
    return Guarded(std::string(), [&] {
        std::string type;
        return ListedAsMount(path, &type) ? type : std::string();
    });
}

std::string WebUtils::GetModifyTime(const std::string &path) {
    if (CheckPathString(path) != 0) {
        return std::string();
    }
    return Guarded(std::string(), [&] {
        struct stat st;
        if (stat(path.c_str(), &st) != 0) {
            QUIB_SET_ERRNO(errno);
            return std::string();
        }
        return std::to_string(static_cast<long long>(st.st_mtime));
    });
}
