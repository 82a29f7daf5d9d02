// The page cut of a listing.
#include <stdint.h>

#include <iterator>

#include "norvo/norvoenum.h"

// The offset is read as a signed 32-bit number, as the web interface's callers have always
// passed it: a negative one walks backward from the first record through the list's end (the
// ring of the records plus the end position), so -1 lands on the end and empties the list and
// -2 keeps the last record. Walks beyond the ring wrap around it (callers stay within the
// count); the position is computed rather than stepped past the end, which would be undefined.
void NvoEnum::NvoLibDirEntrySlice(std::list<DIRENTRY_INFO> &list, unsigned long offset, unsigned long limit) {
    if (list.empty() || limit == 0) {
        return;
    }
    const int64_t signedOffset = static_cast<int32_t>(static_cast<uint32_t>(offset));
    const int64_t ring = static_cast<int64_t>(list.size()) + 1;
    int64_t position = signedOffset % ring;
    if (position < 0) {
        position += ring;
    }
    list.erase(list.begin(), std::next(list.begin(), static_cast<long>(position)));
    if (list.size() <= limit) {
        return;
    }
    list.erase(std::next(list.begin(), static_cast<long>(limit)), list.end());
}
