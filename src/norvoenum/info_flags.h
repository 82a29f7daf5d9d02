// The info flags a listing fills once the sort key has been taken into account: sorting by a
// field needs that field, whatever the caller asked to print.
#pragma once
#include <string.h>

#include "norvo/norvoenum.h"

namespace norvo {

// info with the group of the sort key's field added: "size" NVO_INFO_SIZE; "mtime", "crtime",
// "ctime", "atime" NVO_INFO_TIME; "user", "group" NVO_INFO_OWNER; "posix" NVO_INFO_PERM;
// "type" NVO_INFO_TYPE. A null or any other key ("name") adds nothing.
inline int WidenInfoBySortKey(const char *sortKey, int info) {
    if (sortKey == nullptr) {
        return info;
    }
    static constexpr struct {
        const char *key;
        int flag;
    } kNeeds[] = {
        {"size", NVO_INFO_SIZE},   {"mtime", NVO_INFO_TIME}, {"crtime", NVO_INFO_TIME},
        {"ctime", NVO_INFO_TIME},  {"atime", NVO_INFO_TIME}, {"user", NVO_INFO_OWNER},
        {"group", NVO_INFO_OWNER}, {"posix", NVO_INFO_PERM}, {"type", NVO_INFO_TYPE},
    };
    for (const auto &need : kNeeds) {
        if (strcmp(sortKey, need.key) == 0) {
            return info | need.flag;
        }
    }
    return info;
}

}  // namespace norvo
