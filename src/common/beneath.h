// The one place that opens a user's path. Users make symbolic links through the file-sharing
// protocols; the file manager must never follow one, nor climb out of the share with "..": a
// link inside public to /volume1/photo, another user's home or /etc would otherwise hand the
// user what the share's privilege check never judged. So every user path is opened relative to
// its share's folder (or home folder), component by component beneath it, refusing any link on
// the way, the last component included. Mount points below the folder stay reachable.
#pragma once
#include <string>

namespace norvo {

// An owned descriptor, closed when it goes.
class OwnedFd {
public:
    OwnedFd() = default;
    explicit OwnedFd(int fd) : fd_(fd) {}
    ~OwnedFd() { Reset(); }
    OwnedFd(OwnedFd &&other) noexcept : fd_(other.Release()) {}
    OwnedFd &operator=(OwnedFd &&other) noexcept;
    OwnedFd(const OwnedFd &) = delete;
    OwnedFd &operator=(const OwnedFd &) = delete;

    int Get() const { return fd_; }
    bool IsOpen() const { return fd_ >= 0; }
    int Release() {
        const int fd = fd_;
        fd_ = -1;
        return fd;
    }
    void Reset();

private:
    int fd_ = -1;
};

// The part of realPath below top: "" for top itself, else what follows top and its "/". false
// when realPath is not top or a path below it by whole components.
bool PathBelow(const std::string &top, const std::string &realPath, std::string *below);

// The folder a user path's first component stands for: realPath without the rest of userPath
// (which the resolution appended to the share's or home's folder unchanged). false when
// realPath does not end with that rest, or userPath is not "/" followed by a name.
bool TopOf(const std::string &userPath, const std::string &realPath, std::string *top);

// Opens realPath, which lies at or below top, with flags (O_CLOEXEC is added).
// top itself is opened as configured (it may be a link an administrator made); below it no
// component may be a symbolic link, ".", or "..". Returns the descriptor, or an empty one with
// errno: ELOOP for a link on the way (or at the end), EXDEV when realPath is not below top or
// holds a "." or ".." component, otherwise the errno of the open (ENOENT, EACCES, ENOTDIR...).
OwnedFd OpenBeneath(const std::string &top, const std::string &realPath, int flags);

}  // namespace norvo
