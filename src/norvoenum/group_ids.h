// Reading the platform's group list: every element must be a decimal group id.
//
// Inline so the tests can hand it lists with elements the Linux platform never produces (it
// prints gid_t values itself): the appliance's platform builds the list from text, and a bad
// element must end the enumeration rather than become a wrong id.
#pragma once
#include <stdint.h>

#include <list>

#include "common/log.h"
#include "common/modules.h"
#include "vlibc_szlist.h"

namespace norvo {

// *id = text when text is one or more ASCII digits (no sign, no spaces) whose value fits in 32
// bits; else false.
inline bool ParseGroupId(const char *text, unsigned int *id) {
    uint64_t value = 0;
    const char *p = text;
    for (; *p >= '0' && *p <= '9'; ++p) {
        value = value * 10 + static_cast<uint64_t>(*p - '0');
        if (value > UINT32_MAX) {
            return false;
        }
    }
    if (p == text || *p != '\0') {
        return false;
    }
    *id = static_cast<unsigned int>(value);
    return true;
}

// Appends the ids of list in order. false, logged, at the first element that is null or not a
// group id; the ids before it stay appended.
inline bool AppendGroupIds(PSZLIST list, std::list<unsigned int> &ids) {
    const int count = VLIBCSzListCount(list);
    for (int i = 0; i < count; ++i) {
        const char *element = VLIBCSzListGet(list, i);
        if (element == nullptr) {
            NVO_LOG_AT(kNorvoEnum, 601, "%s:%d Get NULL from QUIBGroupInfoGetgroupList");
            return false;
        }
        unsigned int id = 0;
        if (!ParseGroupId(element, &id)) {
            NVO_LOG_AT(kNorvoEnum, 606, "%s:%d Get Error Formate from QUIBGroupInfoGetgroupList (%s)",
                       element);
            return false;
        }
        ids.push_back(id);
    }
    return true;
}

}  // namespace norvo
