// Human-readable sizes.
#include <stdio.h>

#include "norvo/norvomisc.h"

namespace {

constexpr long long kKiB = 1LL << 10;
constexpr long long kMiB = 1LL << 20;
constexpr long long kGiB = 1LL << 30;

}  // namespace

// The largest unit of which size holds at least one; there is none above GB. Without fraction
// the value is truncated, not rounded (1.9 GB is "1 GB"): intended.
int FileUnitGet(long long size, char *buf, int len, bool fraction) {
    if (buf == nullptr || len <= 0 || size <= 0) {
        return 0;
    }
    const size_t room = static_cast<size_t>(len);
    const double d = static_cast<double>(size);
    if (size / kKiB == 0) {
        snprintf(buf, room, "%lld Bytes", size);
    } else if (size / kMiB == 0) {
        const double value = d * 0.0009765625;
        fraction ? snprintf(buf, room, "%5.2f KB", value)
                 : snprintf(buf, room, "%lld KB", static_cast<long long>(value));
    } else if (size / kGiB == 0) {
        const double value = d * 9.5367431640625e-07;
        fraction ? snprintf(buf, room, "%5.2f MB", value)
                 : snprintf(buf, room, "%lld MB", static_cast<long long>(value));
    } else {
        const double value = d * 9.313225746154785e-10;
        fraction ? snprintf(buf, room, "%5.2f GB", value)
                 : snprintf(buf, room, "%lld GB", static_cast<long long>(value));
    }
    return 1;
}
