// Line files and rename.
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <string_view>

#include "api_guard.h"
#include "locked_file.h"
#include "owned_file.h"
#include "vlibc_line_file.h"

using norvo::platform::FileDescriptor;
using norvo::platform::Guarded;

namespace {

bool HasLineBreak(const char *text) {
    return strpbrk(text, "\r\n") != nullptr;
}

int WriteAt(int fd, const std::string &text, off_t offset) {
    size_t done = 0;
    while (done < text.size()) {
        const ssize_t put =
            pwrite(fd, text.data() + done, text.size() - done, offset + static_cast<off_t>(done));
        if (put < 0 && errno == EINTR) {
            continue;
        }
        if (put <= 0) {
            return errno != 0 ? errno : EIO;
        }
        done += static_cast<size_t>(put);
    }
    return 0;
}

}  // namespace

int VLIBCFileAddLine(const char *file, const char *line) {
    return Guarded(-1, [&] {
        if (file == nullptr || line == nullptr || HasLineBreak(line)) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return -1;
        }
        FileDescriptor fd;
        if (const int code = norvo::platform::OpenOwnFile(file, O_RDWR | O_CREAT, &fd)) {
            QUIB_SET_ERR(code);
            return -1;
        }
        struct stat st;
        if (fstat(fd.Get(), &st) != 0) {
            QUIB_SET_ERRNO(errno);
            return -1;
        }
        // Written at the end the file had: pwrite, not O_APPEND, so a failure can be cut off
        // exactly.
        char last = '\n';
        if (st.st_size > 0 && pread(fd.Get(), &last, 1, st.st_size - 1) != 1) {
            QUIB_SET_ERRNO(errno);
            return -1;
        }
        std::string text = last == '\n' ? std::string() : std::string("\n");
        text.append(line).append("\n");
        if (const int err = WriteAt(fd.Get(), text, st.st_size)) {
            if (ftruncate(fd.Get(), st.st_size) != 0) {
                // Nothing more to do: the next append starts on a fresh line anyway.
            }
            QUIB_SET_ERRNO(err);
            return -1;
        }
        return 0;
    });
}

int VLIBCFileGetLine(const char *file, const char *text, char *buf, int size) {
    return Guarded(-1, [&] {
        if (file == nullptr || text == nullptr || text[0] == '\0' || HasLineBreak(text) || size < 0 ||
            (buf == nullptr && size != 0)) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return -1;
        }
        FileDescriptor fd;
        if (const int code = norvo::platform::OpenOwnFile(file, O_RDONLY, &fd)) {
            QUIB_SET_ERR(code == QUIB_ERR_NO_SUCH_FILE ? QUIB_ERR_OPEN_FAILED : code);
            return -1;
        }
        std::string content;
        if (const int err = norvo::platform::ReadAll(fd.Get(), &content)) {
            QUIB_SET_ERRNO(err);
            return -1;
        }
        const std::string_view all(content);
        size_t pos = 0;
        for (int number = 1; pos < all.size(); ++number) {
            size_t end = all.find('\n', pos);
            if (end == std::string_view::npos) {
                end = all.size();
            }
            std::string_view found = all.substr(pos, end - pos);
            pos = end + 1;
            if (found.find(text) == std::string_view::npos || found.find('\0') != std::string_view::npos) {
                continue;
            }
            if (!found.empty() && found.back() == '\r') {
                found.remove_suffix(1);
            }
            if (buf != nullptr) {
                if (found.size() >= static_cast<size_t>(size)) {
                    QUIB_SET_ERR(QUIB_ERR_NAME_TOO_LONG);
                    return -1;
                }
                memcpy(buf, found.data(), found.size());
                buf[found.size()] = '\0';
            }
            return number;
        }
        QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
        return -1;
    });
}

int VLIBCSysRename(const char *from, const char *to) {
    if (from == nullptr || to == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    if (rename(from, to) != 0) {
        QUIB_SET_ERRNO(errno);
        return -1;
    }
    return 0;
}
