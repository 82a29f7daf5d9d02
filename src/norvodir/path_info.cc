#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/pathinfo.h"

using norvo::kNorvoEnum;

// The platform error and log lines of this function carry fixed line numbers that callers
// and administrators know them by.
int PathInfoFactory::create(const char *user, const std::string &path, PathInfo &out) {
    return norvo::Guarded<int>(0, [&]() -> int {
        if (user == nullptr || path.empty()) {
            NvoLibSetErr(NVO_ERR_GENERAL);
            VLIBCErrSetEx(QUIB_ERR_BAD_PARAMETER, kNorvoEnum, 754);
            return 0;
        }
        out.userPath = path;
        const size_t last = out.userPath.find_last_not_of('/');
        if (last != std::string::npos) {
            out.userPath.erase(last + 1);
        }
        if (out.userPath.empty()) {
            NvoLibSetErr(NVO_ERR_GENERAL);
            VLIBCErrSetEx(QUIB_ERR_BAD_PARAMETER, kNorvoEnum, 767);
            return 0;
        }
        if (NvoFullPathGet(out.userPath.c_str(), out.fullPath, out.shareName, out.volumePath, out.sharePath,
                           user)) {
            return 1;
        }
        switch (NvoLibGetErr()) {
            case NVO_ERR_NO_PATH:
                VLIBCErrSetEx(QUIB_ERR_NO_PATH, kNorvoEnum, 774);
                break;
            case NVO_ERR_GENERAL:
                VLIBCErrSetEx(QUIB_ERR_BAD_PARAMETER, kNorvoEnum, 777);
                break;
            default:
                VLIBCErrSetEx(QUIB_ERR_INTERNAL, kNorvoEnum, 781);
                break;
        }
        NVO_LOG_AT(kNorvoEnum, 784, "%s:%d Fail to get the Full Path, %s", path.c_str());
        return 0;
    });
}
