// An upload's target checked as the user, the uploaded file moved into place, and the upload
// library's error numbers as library codes.
#include <memory>
#include <string>

#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "norvo/norvoupload.h"
#include "norvo/norvouser.h"
#include "norvo/nvoman.h"
#include "quib_file_copy.h"
#include "quib_user.h"

using norvo::kNorvoUpload;

namespace {

constexpr int kWriteRequest = 0x2;

const char *Text(const char *text) {
    return text != nullptr ? text : "(null)";
}

// The file copy's own codes; every other one as the library translates platform codes.
int CopyFailureCode(int platformError) {
    switch (platformError) {
        case 0x0800:
        case 0xA000:
        case 0xA200:
            return NVO_ERR_EXIST;
        case 0xA300:
            return NVO_ERR_UPLOAD_CANCELLED;
        case 0xA400:
            return NVO_ERR_UPLOAD_FILE_TOO_BIG;
        default:
            return NvoParseQuibErrToError(platformError, nullptr);
    }
}

}  // namespace

int CheckFile(std::string path, const char *user, const char *sid, int *type) {
    return norvo::Guarded(int(NVO_ERR_SYSTEM), [&]() -> int {
        std::string fullPath, shareName, volume, sharePath;
        if (NvoFullPathGet(path.c_str(), fullPath, shareName, volume, sharePath,
                           user != nullptr ? user : "") != 1) {
            NVO_LOG(kNorvoUpload, "%s:%d Failed to get fullpath of: %s", path.c_str());
            return NvoLibGetErr();
        }
        if (CheckShareUploadPrivilege(user, sid, path.c_str(), type) != 1) {
            NVO_LOG(kNorvoUpload, "%s:%d No upload privilege to path %s", path.c_str());
            return NvoLibGetErr();
        }
        // From here on the process is the user, whatever the outcome.
        if (NvoLibUGIDSet(sid, user) != 0) {
            NVO_LOG(kNorvoUpload, "%s:%d Failed to set UGID for user=%s, sid=%s", Text(user), Text(sid));
            NvoLibSetErr(NVO_ERR_SYSTEM);
            return NVO_ERR_SYSTEM;
        }
        if (NvoCheckPath(fullPath.c_str(), true, kWriteRequest, nullptr) != 0) {
            NVO_LOG(kNorvoUpload, "%s:%d Invalid path:%s, reason=[%X]", fullPath.c_str(), NvoLibGetErr());
            return NvoLibGetErr();
        }
        return 0;
    });
}

int MoveFile(const char *user, const char *src, const char *dst, int (*progress)(void)) {
    return norvo::Guarded(0, [&] {
        if (src == nullptr || dst == nullptr) {
            return 0;
        }
        PQUIBUSER found = nullptr;
        if (QUIBUserGet(user, &found) < 0) {
            NVO_LOG(kNorvoUpload, "%s (%d) Failed to get user data");
            return 0;
        }
        const std::unique_ptr<QUIBUSER, decltype(&QUIBUserFree)> record(found, &QUIBUserFree);
        QUIB_FILECOPY_OPT options{};
        options.blOverwrite = 1;
        options.blRemoveSource = 1;
        options.blSetOwner = 1;
        options.blKeepTime = 0;
        options.blSync = 1;
        options.pfnProgress = progress;
        options.uid = record->nUID;
        options.gid = record->nGID;
        if (QUIBFileCopy(src, dst, &options) == 0) {
            return 1;
        }
        const int platformError = VLIBCErrGet();
        NVO_LOG(kNorvoUpload, "%s:%d Failed to copy %s to %s, reason=[%X]", src, dst, platformError);
        NvoLibSetErr(CopyFailureCode(platformError));
        return 0;
    });
}

int ConvUploadErrnoToAPIErr(int err) {
    switch (err) {
        case NVO_UPLOAD_ERR_TOO_LARGE:
            return NVO_ERR_UPLOAD_TOO_LARGE;
        case NVO_UPLOAD_ERR_QUOTA:
            return NVO_ERR_QUOTA;
        case NVO_UPLOAD_ERR_LONG_PATH:
            return NVO_ERR_LONG_PATH;
        case NVO_UPLOAD_ERR_SIZE_MISMATCH:
            return NVO_ERR_UPLOAD_SIZE_MISMATCH;
        case NVO_UPLOAD_ERR_INCOMPLETE:
            return NVO_ERR_UPLOAD_INCOMPLETE;
        case NVO_UPLOAD_ERR_NO_FILE:
        case NVO_UPLOAD_ERR_BAD_REQUEST:
            return NVO_ERR_UPLOAD_BAD_REQUEST;
        case NVO_UPLOAD_ERR_NO_PATH:
            return NVO_ERR_NO_PATH;
        case NVO_UPLOAD_ERR_READ_ONLY:
            return NVO_ERR_READ_ONLY;
        case NVO_UPLOAD_ERR_NO_SPACE:
            return NVO_ERR_NO_SPACE;
        case NVO_UPLOAD_ERR_PRIVILEGE:
            return NVO_ERR_PRIVILEGE;
        default:  // -13, -12, -9 and everything else
            return NVO_ERR_SYSTEM;
    }
}
