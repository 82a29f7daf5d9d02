// The per-process error slot and the one errno translator of the platform library.
#include <errno.h>

#include "vlibc_err.h"

namespace {

// Plain globals: the platform calls are used by single-threaded CGI programs.
int g_code = QUIB_ERR_NONE;
const char *g_file = "";
int g_line = 0;

}  // namespace

extern "C" {

void VLIBCErrSetEx(int code, const char *file, int line) {
    g_code = code;
    g_file = file != nullptr ? file : "";
    g_line = line;
}

int VLIBCErrGet(void) {
    return g_code;
}

const char *VLIBCErrorGetFile(void) {
    return g_file;
}

int VLIBCErrorGetLine(void) {
    return g_line;
}

int VLIBCErrFromErrno(int err) {
    switch (err) {
        case EACCES:
        case EPERM:
            return QUIB_ERR_ACCESS_DENIED;
        case ENOENT:
            return QUIB_ERR_NO_SUCH_FILE;
        case ENOTDIR:
            return QUIB_ERR_NO_SUCH_PATH;
        case EDQUOT:
            return QUIB_ERR_QUOTA;
        case ENOSPC:
            return QUIB_ERR_NO_SPACE;
        case EROFS:
            return QUIB_ERR_READ_ONLY_FS;
        case ENAMETOOLONG:
            return QUIB_ERR_NAME_TOO_LONG;
        case ENOMEM:
            return QUIB_ERR_NO_MEMORY;
        case EINVAL:
            return QUIB_ERR_BAD_PARAMETER;
        default:
            return QUIB_ERR_FAILED;
    }
}

}  // extern "C"
