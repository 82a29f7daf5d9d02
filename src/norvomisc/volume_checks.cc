#include <string>

#include "common/log.h"
#include "common/modules.h"
#include "common/share_encryption.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvomisc.h"
#include "quib_fs.h"

using norvo::kNorvoMisc;

namespace {
// Types below this index are the native ones the file manager works on.
constexpr int kFirstUnsupportedType = 7;
}  // namespace

int NvoLibFileSystemSupported(const char *path) {
    VOLUME_INFO volume;
    if (VolumePathParse(path, &volume) <= 0) {
        NVO_LOG(kNorvoMisc, "%s:%d Bad parameters: %s", path != nullptr ? path : "(null)");
        return 1;
    }
    // Only external disks can carry a foreign file system.
    if (volume.kind != VOLUME_KIND_USB && volume.kind != VOLUME_KIND_ESATA) {
        return 1;
    }
    if (QUIBFSIsInMountTable(path) == -1) {
        (void)QUIBGetFSType(path, 0);
    }
    const int fsType = QUIBGetFSType(path, 0);
    if (fsType == -1) {
        NVO_LOG(kNorvoMisc, "%s:%d QUIBGetFSType got error");
        return 0;
    }
    return fsType < kFirstUnsupportedType ? 1 : 0;
}

int NvoLibCheckEncryptShare(const std::string &share, bool *encrypted) {
    if (encrypted == nullptr) {
        NvoLibSetErr(NVO_ERR_GENERAL);
        return 0;
    }
    return norvo::Guarded(0, [&] {
        const norvo::Encryption state = norvo::ShareEncryption(share.c_str());
        *encrypted = state == norvo::Encryption::kEncrypted;
        if (state == norvo::Encryption::kNoShare) {
            NVO_LOG(kNorvoMisc, "%s:%d QUIBShareGet fail %s", share.c_str());
            NvoLibSetErr(NVO_ERR_NO_PATH);
            return 0;
        }
        return 1;
    });
}
