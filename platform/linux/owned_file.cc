#include "owned_file.h"

#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "vlibc_err.h"

namespace norvo::platform {

int OpenOwnFile(const char *path, int flags, FileDescriptor *fd) {
    if (path == nullptr || path[0] != '/') {
        return QUIB_ERR_BAD_PARAMETER;
    }
    if (strlen(path) >= PATH_MAX) {
        return QUIB_ERR_NAME_TOO_LONG;
    }
    const char *name = strrchr(path, '/') + 1;
    if (name[0] == '\0' || strcmp(name, ".") == 0 || strcmp(name, "..") == 0) {
        return QUIB_ERR_BAD_PARAMETER;
    }
    // O_NONBLOCK: a FIFO planted under the name must not hang the open.
    FileDescriptor file(open(path, flags | O_NOFOLLOW | O_CLOEXEC | O_NOCTTY | O_NONBLOCK, 0600));
    if (!file.IsOpen()) {
        return errno == ELOOP || errno == ENXIO || errno == EISDIR ? QUIB_ERR_ACCESS_DENIED
                                                                   : VLIBCErrFromErrno(errno);
    }
    struct stat st;
    if (fstat(file.Get(), &st) != 0) {
        return VLIBCErrFromErrno(errno);
    }
    if (!S_ISREG(st.st_mode) || st.st_uid != geteuid()) {
        return QUIB_ERR_ACCESS_DENIED;
    }
    *fd = std::move(file);
    return QUIB_ERR_NONE;
}

}  // namespace norvo::platform
