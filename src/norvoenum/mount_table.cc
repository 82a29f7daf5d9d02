// NorvoMountStatus: the mount table read once through the standard reader, and the two
// questions the listings ask of it.
#include <mntent.h>
#include <stdio.h>
#include <string.h>

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/norvoenum.h"
#include "quib_fs.h"

using norvo::kNorvoEnum;

namespace {

// getmntent's own buffer is 4 KiB; a longer line (overlay mounts carry long option lists) would
// be cut, so each line gets room for a 4095-byte directory and its options.
constexpr size_t kMountLineBuffer = 64 * 1024;

struct MountTableClose {
    void operator()(FILE *table) const { endmntent(table); }
};
using MountTableFile = std::unique_ptr<FILE, MountTableClose>;

// Exact comparison with the platform's names, first equal wins. A table entry fills its ten
// bytes without a terminator only when the name has ten letters, so the length is bounded.
int FsTypeIndexOfName(const char *type) {
    for (int i = 0; i < QUIB_FSTYPE_COUNT; ++i) {
        const std::string_view name(rgszFsType[i], strnlen(rgszFsType[i], QUIB_FSTYPE_NAME_LEN));
        if (name == type) {
            return i;
        }
    }
    return FSTYPE_UNKNOWN;
}

}  // namespace

int NorvoMountStatus::GetMountStatus() {
    return norvo::Guarded(0, [this] {
        MountTableFile table(setmntent("/proc/mounts", "r"));
        if (!table) {
            VLIBCErrSetEx(QUIB_ERR_OPEN_FAILED, kNorvoEnum, 812);
            return 0;
        }
        std::vector<char> line(kMountLineBuffer);
        mntent entry{};
        while (getmntent_r(table.get(), &entry, line.data(), static_cast<int>(line.size())) != nullptr) {
            MOUNT_STATUS status;
            status.readOnly = hasmntopt(&entry, "ro") != nullptr;
            status.fsType = FsTypeIndexOfName(entry.mnt_type);
            // emplace keeps an existing entry: of stacked and bind mounts the first line counts.
            mounts_.emplace(entry.mnt_dir, status);
        }
        loaded_ = true;
        return 1;
    });
}

bool NorvoMountStatus::IsReadOnly(const char *path) {
    if (path == nullptr || (!loaded_ && !GetMountStatus())) {
        return false;
    }
    const size_t pathLength = strlen(path);
    bool readOnly = false;
    // In ascending byte order a directory comes before every longer one it is a prefix of, so
    // the last match is the deepest mount. The root "/" matches only "/" and "//...": intended.
    for (const auto &[dir, status] : mounts_) {
        if (pathLength >= dir.size() && dir.compare(0, dir.size(), path, dir.size()) == 0 &&
            (path[dir.size()] == '\0' || path[dir.size()] == '/')) {
            readOnly = status.readOnly;
        }
    }
    return readOnly;
}

int NorvoMountStatus::getFSTYPE(const char *path) {
    if (path == nullptr) {
        return FSTYPE_NOT_MOUNT_POINT;
    }
    return norvo::Guarded<int>(FSTYPE_UNKNOWN, [this, path]() -> int {
        std::string dir(path);
        const size_t last = dir.find_last_not_of('/');
        dir.erase(last == std::string::npos ? 0 : last + 1);
        if (!loaded_ && !GetMountStatus()) {
            return FSTYPE_UNKNOWN;
        }
        const auto found = mounts_.find(dir);
        return found == mounts_.end() ? FSTYPE_NOT_MOUNT_POINT : found->second.fsType;
    });
}
