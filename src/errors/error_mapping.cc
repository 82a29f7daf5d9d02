#include <errno.h>

#include "common/share_encryption.h"
#include "norvo/errors.h"
#include "quib_fs.h"
#include "vlibc_err.h"

namespace {

// A name too long is reported with its own key inside encrypted shares, whose names are
// shorter on disk.
int LongPathError(const char *path) {
    if (path == nullptr) {
        return NVO_ERR_LONG_PATH;
    }
    // Asked without touching the slot: a translation only answers, its caller stores.
    return norvo::ShareEncryption(path) == norvo::Encryption::kEncrypted ? NVO_ERR_ENCRYPTION_LONG_PATH
                                                                         : NVO_ERR_LONG_PATH;
}

}  // namespace

int NvoParseErrnoToError(int err, const char *path, const char *mountPath) {
    switch (err) {
        case EPERM:
        case EACCES:
            return NVO_ERR_PRIVILEGE;
        case ENOENT:
        case ENOTDIR:
            return NVO_ERR_NO_PATH;
        case EIO:
            return NVO_ERR_IO;
        case EBUSY:
            if (mountPath == nullptr) {
                return NVO_ERR_BUSY;
            }
            return QUIBFSIsInMountTable(mountPath) == -1 ? NVO_ERR_BUSY : NVO_ERR_FOLDER_BUSY;
        case EEXIST:
        case ENOTEMPTY:
            return NVO_ERR_EXIST;
        case ENOSPC:
            return NVO_ERR_NO_SPACE;
        case EROFS:
            return NVO_ERR_READ_ONLY;
        case ENAMETOOLONG:
            return LongPathError(path);
        case EDQUOT:
            return NVO_ERR_QUOTA;
        default:
            return NVO_ERR_SYSTEM;
    }
}

int NvoParseQuibErrToError(int quibErr, const char *path) {
    switch (quibErr) {
        case 0x0300:
            return NVO_ERR_PRIVILEGE;
        case 0x0600:
        case 0x0700:
            return NVO_ERR_NO_PATH;
        case 0x2400:
            return NVO_ERR_QUOTA;
        case 0x2900:
            return NVO_ERR_NO_SPACE;
        case 0x8400:
            return NVO_ERR_READ_ONLY;
        case 0xA500:
            return NVO_ERR_FAT_RESERVED_NAME;
        case 0xC300:
            return LongPathError(path);
        default:
            return NVO_ERR_SYSTEM;
    }
}

const char *NvoParseErrorToOBXString(int code, const char *fallback) {
    static const char kSystem[] = "error:error_error_system";
    switch (code) {
        // Fixed to the system key: these never take the caller's fallback.
        case 400:
        case 401:
        case 402:
        case 420:
        case 1400:
        case 1404:
        case 1405:
            return kSystem;
        case 403:
        case 404:
        case 405:
            return "error:error_invalid_user_group";
        case 406:
            return "error:error_testjoin";
        case 407:
        case 409:
            return "error:error_privilege_not_enough";
        case 408:
            return "error:error_no_path";
        case 410:
            return "error:conn_rv_fail";
        case 411:
            return "error:error_fs_ro";
        case 412:
            return "error:error_long_path";
        case 413:
            return "error:error_encryption_long_path";
        case 414:
            return "error:error_file_exist";
        case 415:
            return "error:error_quota_not_enough";
        case 416:
            return "error:error_space_not_enough";
        case 417:
            return "error:error_io";
        case 418:
            return "error:error_reserved_name";
        case 419:
            return "error:error_fat_reserved_name";
        case 421:
            return "error:error_folder_busy";
        case 1004:
            return "error:error_overwrite_fail";
        case 1005:
            return "error:error_select_conflict";
        case 1006:
            return "error:mvcp_filename_illegal";
        case 1007:
            return "error:mvcp_file_too_big";
        case 1401:
            return "error:error_invalid_archive";
        case 1402:
            return "error:error_invalid_archive_data";
        case 1403:
            return "error:extract_passwd_missing";
        default:
            return fallback != nullptr ? fallback : kSystem;
    }
}
