// The order and the page cut of listed records, on what decides them rather than on the
// records: the list methods and the directory listing's own store share them.
#pragma once
#include <stddef.h>
#include <stdint.h>

#include <functional>
#include <string>
#include <vector>

#include "norvo/norvoenum.h"

namespace norvo {

enum class SortRule { kName, kSize, kMtime, kCrtime, kCtime, kAtime, kUser, kGroup, kPosix, kType };

// The rule of a sort key; any key that is not one of the field names sorts by name.
SortRule SortRuleOf(const std::string &key);

// What one record's place depends on. The strings must outlive the sort.
struct SortFacts {
    const char *name;
    const char *type;  // read by the "type" rule only
    int64_t value;     // the rule's field (0 where the rule reads no number)
    bool isdir;
};

// The facts of entry under rule; the strings point into entry.
SortFacts SortFactsOf(SortRule rule, const DIRENTRY_INFO &entry);

// The positions 0..count-1 in EnumCompare's order of the facts factsAt(i) returns: directories
// first, then the rule's field, then the case-insensitive name; ties keep their positions'
// order. Throws std::bad_alloc only.
std::vector<size_t> SortedPositions(size_t count, SortRule rule,
                                    const std::function<SortFacts(size_t)> &factsAt);

// The records [*first, *last) of count that the page of offset and limit keeps (see
// NvoEnum::NvoLibDirEntrySlice): all of them when count or limit is 0.
void PageRange(size_t count, unsigned long offset, unsigned long limit, size_t *first, size_t *last);

}  // namespace norvo
