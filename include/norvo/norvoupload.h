// Uploads: may the user put a file at a target, the uploaded file moved into place, and the
// upload library's error numbers as library codes.
#pragma once
#include <string>

#include "norvo/export.h"

// The error numbers of the appliance's upload library (negative), by what went wrong.
enum {
    NVO_UPLOAD_ERR_PRIVILEGE = -1,      // 407
    NVO_UPLOAD_ERR_NO_SPACE = -2,       // 416
    NVO_UPLOAD_ERR_READ_ONLY = -3,      // 411
    NVO_UPLOAD_ERR_NO_PATH = -4,        // 408
    NVO_UPLOAD_ERR_BAD_REQUEST = -5,    // 1800: the multipart body is malformed
    NVO_UPLOAD_ERR_NO_FILE = -6,        // 1800: the request holds no file part
    NVO_UPLOAD_ERR_INCOMPLETE = -7,     // 1801: the body ended before the file did
    NVO_UPLOAD_ERR_SIZE_MISMATCH = -8,  // 1802: the file's size is not the one announced
    NVO_UPLOAD_ERR_SYSTEM = -9,         // 401
    NVO_UPLOAD_ERR_LONG_PATH = -10,     // 412
    NVO_UPLOAD_ERR_QUOTA = -11,         // 415
    NVO_UPLOAD_ERR_TEMP_FILE = -12,     // 401: the temporary could not be made
    NVO_UPLOAD_ERR_NO_MEMORY = -13,     // 401
    NVO_UPLOAD_ERR_TOO_LARGE = -14,     // 1803: over the size the upload accepts
};

// The library codes of uploads (no message key of their own).
enum {
    NVO_ERR_UPLOAD_BAD_REQUEST = 1800,
    NVO_ERR_UPLOAD_INCOMPLETE = 1801,
    NVO_ERR_UPLOAD_SIZE_MISMATCH = 1802,
    NVO_ERR_UPLOAD_TOO_LARGE = 1803,
    NVO_ERR_UPLOAD_FILE_TOO_BIG = 1804,  // too big for the target's file system (4 GiB on FAT)
    NVO_ERR_UPLOAD_CANCELLED = 1805,     // the progress callback stopped the move
};

// 0 when user may upload to the user-visible path: resolved, the share's upload privilege
// (which may set *type to 2), then, as the user (NvoLibUGIDSet: the process keeps that identity
// whatever follows), the longest existing part of the real path must be writable by the user
// and hold no reserved name. Else the library code (also in the slot), 401 when the identity
// can't be taken.
NORVO_API int CheckFile(std::string path, const char *user, const char *sid, int *type);

NORVO_BEGIN_C

// Moves the uploaded file src to the real path dst, owned by user (uid, primary gid), replacing
// a file there, through QUIBFileCopy (a rename on one file system, else an exclusive temporary
// copy synced and renamed; no link on dst's way is followed). progress (may be null) runs per
// chunk; non-zero stops the move, leaving dst as it was (1805). 1 on success; 0 on failure with
// the code set, but 0 with the slot untouched for a null path or an unknown user.
NORVO_API int MoveFile(const char *user, const char *src, const char *dst, int (*progress)(void));
// The library code of an upload library error number (NVO_UPLOAD_ERR_*); 401 for any other.
NORVO_API int ConvUploadErrnoToAPIErr(int err);

NORVO_END_C
