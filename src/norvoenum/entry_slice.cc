// The page cut of a listing.
#include <stdint.h>

#include <iterator>

#include "norvo/norvoenum.h"
#include "norvoenum/entry_order.h"

namespace norvo {

// The offset is read as a signed 32-bit number, as the web interface's callers have always
// passed it: a negative one walks backward from the first record through the list's end (the
// ring of the records plus the end position), so -1 lands on the end and empties the page and
// -2 keeps the last record. Walks beyond the ring wrap around it (callers stay within the
// count); the position is computed rather than stepped past the end, which would be undefined.
void PageRange(size_t count, unsigned long offset, unsigned long limit, size_t *first, size_t *last) {
    *first = 0;
    *last = count;
    if (count == 0 || limit == 0) {
        return;
    }
    const int64_t signedOffset = static_cast<int32_t>(static_cast<uint32_t>(offset));
    const int64_t ring = static_cast<int64_t>(count) + 1;
    int64_t position = signedOffset % ring;
    if (position < 0) {
        position += ring;
    }
    *first = static_cast<size_t>(position);
    if (count - *first > limit) {
        *last = *first + limit;
    }
}

}  // namespace norvo

namespace {

// The node at index (0..size), walked to from the nearer end.
std::list<DIRENTRY_INFO>::iterator At(std::list<DIRENTRY_INFO> &list, size_t index) {
    const size_t size = list.size();
    if (index <= size / 2) {
        return std::next(list.begin(), static_cast<long>(index));
    }
    return std::prev(list.end(), static_cast<long>(size - index));
}

}  // namespace

void NvoEnum::NvoLibDirEntrySlice(std::list<DIRENTRY_INFO> &list, unsigned long offset, unsigned long limit) {
    size_t first = 0;
    size_t last = 0;
    norvo::PageRange(list.size(), offset, limit, &first, &last);
    list.erase(At(list, last), list.end());
    list.erase(list.begin(), At(list, first));
}
