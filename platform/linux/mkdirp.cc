// Directory creation with parents: every directory created gets the requested owner and the
// exact mode; existing directories are left as they are.
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <string_view>
#include <vector>

#include "api_guard.h"
#include "fs_path.h"
#include "locked_file.h"
#include "quib_fs.h"

namespace norvo::platform {
namespace {

struct Component {
    std::string_view name;
    size_t end;  // where the component ends in the whole path
};

// Creates name under parent and opens it (O_PATH) into *out. 0 or the errno.
// The new directory starts as 0700 and is finished through its own descriptor, so it is
// never reachable with a mode or owner other than the requested ones, and a directory
// swapped in by someone else is never changed.
int MakeOne(int parent, const std::string &name, bool last, uid_t uid, gid_t gid, mode_t mode,
            FileDescriptor *out) {
    if (mkdirat(parent, name.c_str(), 0700) == 0) {
        FileDescriptor dir(openat(parent, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        int err = 0;
        if (!dir.IsOpen() || fchown(dir.Get(), uid, gid) != 0 || fchmod(dir.Get(), mode) != 0) {
            err = errno;
        }
        if (err != 0) {
            // Also when it could not be opened: left behind, the 0700 directory of the wrong
            // owner would stand in for the real one from then on. rmdir only takes an empty
            // directory, so whatever else was swapped in stays untouched.
            unlinkat(parent, name.c_str(), AT_REMOVEDIR);
            return err;
        }
        *out = std::move(dir);
        return 0;
    }
    if (errno != EEXIST) {
        return errno;
    }
    // Like mkdir -p, an existing link to a directory counts as the directory.
    out->Reset(openat(parent, name.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (out->IsOpen()) {
        return 0;
    }
    if (errno == ENOTDIR) {
        return last ? EEXIST : ENOTDIR;
    }
    return errno;
}

std::vector<Component> SplitComponents(std::string_view path) {
    std::vector<Component> parts;
    size_t pos = 0;
    while (pos < path.size()) {
        size_t slash = path.find('/', pos);
        if (slash == std::string_view::npos) {
            slash = path.size();
        }
        if (slash > pos) {
            parts.push_back({path.substr(pos, slash - pos), slash});
        }
        pos = slash + 1;
    }
    return parts;
}

void ReportStop(char *stopAt, int stopAtSize, std::string_view where) {
    if (stopAt != nullptr && stopAtSize > 0) {
        snprintf(stopAt, static_cast<size_t>(stopAtSize), "%.*s", static_cast<int>(where.size()),
                 where.data());
    }
}

}  // namespace
}  // namespace norvo::platform

using namespace norvo::platform;

extern "C" int QUIBFSMkdirP(const char *path, char *stopAt, int stopAtSize, int recursive, uid_t uid,
                            gid_t gid, mode_t mode) {
    if (const int err = CheckPathArgument(path)) {
        ReportStop(stopAt, stopAtSize, path != nullptr ? path : "");
        return NORVO_FAIL_ERRNO(err);
    }
    return Guarded(-1, [&] {
        const std::string_view whole(path);
        const std::vector<Component> parts = SplitComponents(whole);
        if (parts.empty()) {
            return 0;  // the root always exists
        }
        size_t first = recursive != 0 ? 0 : parts.size() - 1;
        FileDescriptor current;
        int parent = AT_FDCWD;
        if (whole.front() == '/' || first > 0) {
            const std::string start = first > 0 ? std::string(whole.substr(0, parts[first - 1].end)) : "/";
            current.Reset(open(start.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
            if (!current.IsOpen()) {
                const int err = errno;
                ReportStop(stopAt, stopAtSize, whole);
                return NORVO_FAIL_ERRNO(err);
            }
            parent = current.Get();
        }
        for (size_t i = first; i < parts.size(); ++i) {
            FileDescriptor next;
            const int err = MakeOne(parent, std::string(parts[i].name), i + 1 == parts.size(), uid, gid,
                                    mode & 07777, &next);
            if (err != 0) {
                ReportStop(stopAt, stopAtSize, whole.substr(0, parts[i].end));
                return NORVO_FAIL_ERRNO(err);
            }
            current = std::move(next);
            parent = current.Get();
        }
        return 0;
    });
}
