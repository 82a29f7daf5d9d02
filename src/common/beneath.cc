#include "common/beneath.h"

#include <errno.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>

#include "common/path_names.h"

namespace norvo {
namespace {

std::atomic<bool> g_noOpenat2{false};

// openat2 beneath dir: no link, no magic link, no escape; mounts are crossed. -1 with errno;
// ENOSYS when the kernel lacks it.
int Openat2Beneath(int dir, const char *below, int flags) {
    struct open_how how {};
    how.flags = static_cast<unsigned long long>(flags);
    how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
    int fd = -1;
    // EAGAIN: a rename or mount raced the lookup's check that it stayed beneath; try again, a
    // bounded number of times (renames can be made to race it forever).
    for (int attempt = 0; attempt < 64; ++attempt) {
        fd = static_cast<int>(syscall(SYS_openat2, dir, below, &how, sizeof how));
        if (fd >= 0 || (errno != EAGAIN && errno != EINTR)) {
            break;
        }
    }
    return fd;
}

// The same, one component at a time: each opened without following and checked not to be a
// link before the next is looked up in it.
OwnedFd OpenComponentwise(int top, const std::string &below, int flags) {
    OwnedFd current;
    int at = top;
    size_t start = 0;
    while (true) {
        size_t end = below.find('/', start);
        const bool last = end == std::string::npos;
        if (last) {
            end = below.size();
        }
        const std::string name = below.substr(start, end - start);
        start = end + 1;
        if (name.empty()) {
            if (last) {
                break;
            }
            continue;
        }
        OwnedFd next(
            openat(at, name.c_str(), (last ? flags : O_PATH | O_DIRECTORY) | O_NOFOLLOW | O_CLOEXEC));
        if (!next.IsOpen()) {
            // O_DIRECTORY answers ENOTDIR for a link to a folder: say it is a link.
            const int err = errno;
            struct stat st;
            const bool link = err == ENOTDIR && fstatat(at, name.c_str(), &st, AT_SYMLINK_NOFOLLOW) == 0 &&
                              S_ISLNK(st.st_mode);
            errno = link ? ELOOP : err;
            return OwnedFd();
        }
        // O_PATH | O_NOFOLLOW may open a link itself.
        struct stat st;
        if (fstat(next.Get(), &st) != 0) {
            return OwnedFd();
        }
        if (S_ISLNK(st.st_mode)) {
            errno = ELOOP;
            return OwnedFd();
        }
        if (last) {
            return next;
        }
        current = std::move(next);
        at = current.Get();
    }
    // Only empty components: the folder itself.
    return OwnedFd(openat(at, ".", flags | O_CLOEXEC));
}

}  // namespace

OwnedFd &OwnedFd::operator=(OwnedFd &&other) noexcept {
    if (this != &other) {
        Reset();
        fd_ = other.Release();
    }
    return *this;
}

void OwnedFd::Reset() {
    if (fd_ >= 0) {
        const int saved = errno;  // a close on the way out of a failure keeps the failure's errno
        close(fd_);
        errno = saved;
        fd_ = -1;
    }
}

bool PathBelow(const std::string &top, const std::string &realPath, std::string *below) {
    if (top.empty() || realPath.compare(0, top.size(), top) != 0) {
        return false;
    }
    if (realPath.size() == top.size()) {
        below->clear();
        return true;
    }
    if (top.back() != '/' && realPath[top.size()] != '/') {
        return false;  // /volume1/photos is not below /volume1/photo
    }
    *below = realPath.substr(top.size());
    return true;
}

bool TopOf(const std::string &userPath, const std::string &realPath, std::string *top) {
    if (userPath.size() < 2 || userPath[0] != '/' || userPath[1] == '/') {
        return false;
    }
    const size_t slash = userPath.find('/', 1);
    const size_t restSize = slash == std::string::npos ? 0 : userPath.size() - slash;
    if (realPath.size() <= restSize || realPath.compare(realPath.size() - restSize, restSize, userPath,
                                                        userPath.size() - restSize, restSize) != 0) {
        return false;
    }
    *top = realPath.substr(0, realPath.size() - restSize);
    return true;
}

OwnedFd OpenBeneath(const std::string &top, const std::string &realPath, int flags) {
    std::string below;
    if (!PathBelow(top, realPath, &below) || HasDotComponent(below)) {
        errno = EXDEV;
        return OwnedFd();
    }
    size_t first = below.find_first_not_of('/');
    if (first == std::string::npos) {
        return OwnedFd(open(top.c_str(), flags | O_CLOEXEC));  // the folder itself, as configured
    }
    OwnedFd folder(open(top.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!folder.IsOpen()) {
        return OwnedFd();
    }
    const std::string relative = below.substr(first);
    if (!g_noOpenat2.load(std::memory_order_relaxed)) {
        // Without O_NOFOLLOW a final link is refused too (ELOOP), O_PATH or not.
        const int fd = Openat2Beneath(folder.Get(), relative.c_str(), (flags & ~O_NOFOLLOW) | O_CLOEXEC);
        if (fd >= 0 || errno != ENOSYS) {
            return OwnedFd(fd);
        }
        g_noOpenat2.store(true, std::memory_order_relaxed);
    }
    return OpenComponentwise(folder.Get(), relative, flags);
}

}  // namespace norvo
