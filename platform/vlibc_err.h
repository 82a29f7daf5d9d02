// The platform's per-process error slot: the code of the last failed platform call and the
// source place that set it. Every platform call that fails sets it; none clears it on success.
#pragma once
#include "platform_export.h"

// Platform error codes. Only the values matter to callers; the names are for readability.
enum {
    QUIB_ERR_NONE = 0x0000,
    QUIB_ERR_ACCESS_DENIED = 0x0300,  // the kernel refused access (EACCES, EPERM)
    QUIB_ERR_NO_SUCH_FILE = 0x0600,   // ENOENT
    QUIB_ERR_NO_SUCH_PATH = 0x0700,   // ENOTDIR: a parent is not a directory
    QUIB_ERR_OPEN_FAILED = 0x0900,    // a settings file is missing or a key is absent
    QUIB_ERR_BAD_PARAMETER = 0x0D00,  // null or malformed argument
    QUIB_ERR_REMOTE_FS = 0x1100,      // the path is on a network file system
    QUIB_ERR_NO_SUCH_SHARE = 0x1400,
    QUIB_ERR_NO_SUCH_USER = 0x1D00,
    QUIB_ERR_NO_SUCH_GROUP = 0x1E00,
    QUIB_ERR_QUOTA = 0x2400,     // EDQUOT
    QUIB_ERR_NO_SPACE = 0x2900,  // ENOSPC
    QUIB_ERR_NO_MEMORY = 0x2B00,
    QUIB_ERR_INTERNAL = 0x8000,
    QUIB_ERR_FAILED = 0x8100,        // generic failure of a system call
    QUIB_ERR_READ_ONLY_FS = 0x8400,  // EROFS
    QUIB_ERR_NOT_DIRECTORY = 0xA000,
    QUIB_ERR_FAT_RESERVED = 0xA500,
    QUIB_ERR_NO_PATH = 0xBE00,
    QUIB_ERR_NAME_TOO_LONG = 0xC300,  // ENAMETOOLONG
    QUIB_ERR_NOT_MOUNTED = 0xD700,    // the volume holding the path is not mounted
    QUIB_ERR_ACL_NOT_SUPPORTED = 0xD800,
};

QUIB_BEGIN_C

// Stores code with the place that set it. file is kept by pointer: pass a string literal.
QUIB_API void VLIBCErrSetEx(int code, const char *file, int line);
// The code of the last failure (0 at process start).
QUIB_API int VLIBCErrGet(void);
// The file and line given with the last code ("" and 0 before any failure).
QUIB_API const char *VLIBCErrorGetFile(void);
QUIB_API int VLIBCErrorGetLine(void);

// Translates a system errno into the platform code above (QUIB_ERR_FAILED for the rest).
QUIB_API int VLIBCErrFromErrno(int err);

QUIB_END_C

// Platform code sets the slot through this, so the place is always the real one: the source
// file's name, as the library's own places are, never the path it was built from.
#ifdef __FILE_NAME__
#define QUIB_SOURCE_NAME __FILE_NAME__
#else
#define QUIB_SOURCE_NAME __FILE__
#endif
#define QUIB_SET_ERR(code) VLIBCErrSetEx((code), QUIB_SOURCE_NAME, __LINE__)
