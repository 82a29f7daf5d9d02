#include "locked_file.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace norvo::platform {

FileDescriptor &FileDescriptor::operator=(FileDescriptor &&other) noexcept {
    if (this != &other) {
        Reset(other.Release());
    }
    return *this;
}

int FileDescriptor::Release() {
    int fd = fd_;
    fd_ = -1;
    return fd;
}

void FileDescriptor::Reset(int fd) {
    if (fd_ >= 0) {
        close(fd_);
    }
    fd_ = fd;
}

int LockFile(int fd, int operation) {
    while (flock(fd, operation) != 0) {
        if (errno != EINTR) {
            return errno;
        }
    }
    return 0;
}

int LockFileForProcess(int fd) {
    struct flock whole {};
    whole.l_type = F_WRLCK;
    whole.l_whence = SEEK_SET;
    while (fcntl(fd, F_SETLKW, &whole) != 0) {
        if (errno != EINTR) {
            return errno;
        }
    }
    return 0;
}

int ReadAll(int fd, std::string *text) {
    std::string out;
    char chunk[16384];
    for (;;) {
        ssize_t n = read(fd, chunk, sizeof chunk);
        if (n < 0) {
            if (errno == EINTR) {
                continue;
            }
            return errno;
        }
        if (n == 0) {
            break;
        }
        if (out.size() + static_cast<size_t>(n) > kMaxSettingsFileSize) {
            return EFBIG;
        }
        out.append(chunk, static_cast<size_t>(n));
    }
    *text = std::move(out);
    return 0;
}

int ReadWholeFile(const char *path, std::string *text) {
    // O_NONBLOCK so that a FIFO put in place of a settings file cannot hang the open.
    FileDescriptor fd(open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    if (!fd.IsOpen()) {
        return errno;
    }
    struct stat st;
    if (fstat(fd.Get(), &st) != 0) {
        return errno;
    }
    if (!S_ISREG(st.st_mode)) {
        return S_ISDIR(st.st_mode) ? EISDIR : EINVAL;
    }
    return ReadAll(fd.Get(), text);
}

}  // namespace norvo::platform
