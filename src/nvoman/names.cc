#include <errno.h>
#include <string.h>

#include "common/log.h"
#include "common/modules.h"
#include "common/text.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/nvoman.h"
#include "quib_fs.h"

using norvo::kNvoMan;

namespace {
// Characters a FAT file system can't hold in a name.
constexpr char kFatForbidden[] = "\\/:*?\"><|\r\n";
}  // namespace

int NvoCheckReservedName(const char *name) {
    return norvo::Guarded<int>(0, [&]() -> int {
        if (norvo::IsEmpty(name)) {
            NvoLibSetErr(NVO_ERR_GENERAL);
            return 0;
        }
        const bool reserved = strcmp(name, ".") == 0 || strcmp(name, "..") == 0 ||
                              strchr(name, ':') != nullptr || strchr(name, '/') != nullptr ||
                              strncmp(name, "._", 2) == 0 || QUIBEAIsHiddenDir(name) == 1;
        if (reserved) {
            NvoLibSetErr(NVO_ERR_RESERVED_NAME);
            return 0;
        }
        return 1;
    });
}

int NvoCheckFileName(const char *dir, const char *name) {
    return norvo::Guarded<int>(-1, [&]() -> int {
        if (dir == nullptr || norvo::IsEmpty(name)) {
            NvoLibSetErr(NVO_ERR_GENERAL);
            return -1;
        }
        if (!NvoCheckReservedName(name)) {
            return -1;
        }
        const int fsType = QUIBGetFSType(dir, 0);
        if (fsType < 0) {
            const int err = errno;
            NvoLibSetErr(NvoParseErrnoToError(err, nullptr, nullptr));
            NVO_LOG(kNvoMan, "%s:%d Failed to statfs %s, reason=%s", dir, strerror(err));
            return -1;
        }
        // Elsewhere these characters are ordinary.
        if (fsType == FSTYPE_FAT && strpbrk(name, kFatForbidden) != nullptr) {
            NvoLibSetErr(NVO_ERR_FAT_RESERVED_NAME);
            return -1;
        }
        return 0;
    });
}
