// The per-process error slot, and the translations into library codes and message keys.
//
// A failing operation stores one library code in the slot and returns its own failure value;
// the caller reads the slot right after the failure (it is never reset on success) and turns
// the code into the message key the web interface shows.
#pragma once
#include "norvo/export.h"

enum {
    NVO_ERR_NONE = 0,
    NVO_ERR_GENERAL = 400,
    NVO_ERR_SYSTEM = 401,
    NVO_ERR_ACCESS = 402,
    NVO_ERR_NO_USER = 403,
    NVO_ERR_NO_GROUP = 404,
    NVO_ERR_USER_GROUP = 405,
    NVO_ERR_TESTJOIN = 406,
    NVO_ERR_PRIVILEGE = 407,
    NVO_ERR_NO_PATH = 408,
    NVO_ERR_PRIVILEGE_DENIED = 409,
    NVO_ERR_REMOTE_FS = 410,
    NVO_ERR_READ_ONLY = 411,
    NVO_ERR_LONG_PATH = 412,
    NVO_ERR_ENCRYPTION_LONG_PATH = 413,
    NVO_ERR_EXIST = 414,
    NVO_ERR_QUOTA = 415,
    NVO_ERR_NO_SPACE = 416,
    NVO_ERR_IO = 417,
    NVO_ERR_RESERVED_NAME = 418,
    NVO_ERR_FAT_RESERVED_NAME = 419,
    NVO_ERR_BUSY = 420,
    NVO_ERR_FOLDER_BUSY = 421,
    NVO_ERR_OVERWRITE = 1004,
    NVO_ERR_SELECT_CONFLICT = 1005,
    NVO_ERR_FILENAME_ILLEGAL = 1006,
    NVO_ERR_FILE_TOO_BIG = 1007,
};

NORVO_BEGIN_C

// Stores code in the slot and returns it, so a caller can set and return in one statement.
NORVO_API int NvoLibSetErr(int code);
// The slot's current value.
NORVO_API int NvoLibGetErr(void);

// The library code for a system errno. path matters only for ENAMETOOLONG (413 when it lies
// in an encrypted share, else 412) and mountPath only for EBUSY (421 when the mount table
// knows it, else 420); both may be null. Never touches the slot itself, though the encryption
// check for ENAMETOOLONG may write 408 there: store the result over it.
NORVO_API int NvoParseErrnoToError(int err, const char *path, const char *mountPath);
// The library code for a platform error code (VLIBCErrGet after a failed platform call).
// path matters only for the name-too-long code, as above.
NORVO_API int NvoParseQuibErrToError(int quibErr, const char *path);
// The message key of a library code (a static string). Codes without a key of their own give
// fallback, or "error:error_error_system" when fallback is null; 400-402, 420, 1400, 1404 and
// 1405 are fixed to the system key and never take the fallback.
NORVO_API const char *NvoParseErrorToOBXString(int code, const char *fallback);

NORVO_END_C
