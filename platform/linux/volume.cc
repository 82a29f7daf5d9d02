// Volume names: /volumeN (internal), /volumeUSBN and /volumeSATAN (external disks).
#include <stdio.h>
#include <string.h>

#include <string_view>

#include "api_guard.h"
#include "fs_path.h"
#include "quib_fs.h"
#include "volume_name.h"

namespace {

struct VolumePrefix {
    std::string_view text;
    int kind;
};

// Longer prefixes first: "/volume" alone would take "/volumeUSB1" as a malformed volume.
constexpr VolumePrefix kPrefixes[] = {
    {"/volumeUSB", VOLUME_KIND_USB},
    {"/volumeSATA", VOLUME_KIND_ESATA},
    {"/volume", VOLUME_KIND_INTERNAL},
};

bool IsDigit(char c) {
    return c >= '0' && c <= '9';
}

}  // namespace

namespace norvo::platform {

int VolumeKindOf(std::string_view path, size_t *prefixLength) {
    for (const VolumePrefix &prefix : kPrefixes) {
        if (path.compare(0, prefix.text.size(), prefix.text) != 0) {
            continue;
        }
        size_t end = prefix.text.size();
        while (end < path.size() && IsDigit(path[end])) {
            ++end;
        }
        if (end == prefix.text.size() || (end < path.size() && path[end] != '/')) {
            return 0;  // "/volume", "/volumeUSB", "/volume1x": no volume
        }
        *prefixLength = end;
        return prefix.kind;
    }
    return 0;
}

}  // namespace norvo::platform

extern "C" int VolumePathParse(const char *path, PVOLUME_INFO info) {
    if (info == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    if (const int err = norvo::platform::CheckPathArgument(path)) {
        QUIB_SET_ERRNO(err);
        return -1;
    }
    size_t length = 0;
    const int kind = norvo::platform::VolumeKindOf(path, &length);
    if (kind == 0 || length >= sizeof info->szVolumePath) {
        return 0;  // no volume number is that long
    }
    memcpy(info->szVolumePath, path, length);
    info->szVolumePath[length] = '\0';
    info->kind = kind;
    return 1;
}
