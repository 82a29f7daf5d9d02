// String lists and the tokenizer. Lists are C structures owned through VLIBCSzListFree; only
// the item array grows, so a list never moves once allocated.
#include <limits.h>
#include <stdlib.h>
#include <string.h>
#include <strings.h>

#include <algorithm>
#include <vector>

#include "api_guard.h"
#include "vlibc_szlist.h"

namespace {

constexpr int kKnownSortFlags =
    SZLIST_SORT_DESC | SZLIST_SORT_NUMERIC | SZLIST_SORT_CASE_SENSITIVE | SZLIST_SORT_CASE_INSENSITIVE;

bool IsUsable(const SZLIST *list) {
    return list != nullptr && list->nItem >= 0 && list->nAlloc >= list->nItem &&
           (list->pszItem != nullptr || list->nAlloc == 0);
}

// Makes room for one more item; false (list unchanged) when memory or int range runs out.
bool Reserve(SZLIST *list) {
    if (list->nItem < list->nAlloc) {
        return true;
    }
    if (list->nAlloc > INT_MAX / 2) {
        return false;
    }
    int grown = list->nAlloc < 4 ? 8 : list->nAlloc * 2;
    void *items = realloc(list->pszItem, sizeof(char *) * static_cast<size_t>(grown));
    if (items == nullptr) {
        return false;
    }
    list->pszItem = static_cast<char **>(items);
    list->nAlloc = grown;
    return true;
}

// Appends an owned copy of bytes [text, text+len); false when out of memory.
bool Append(SZLIST *list, const char *text, size_t len) {
    if (!Reserve(list)) {
        return false;
    }
    char *copy = static_cast<char *>(malloc(len + 1));
    if (copy == nullptr) {
        return false;
    }
    memcpy(copy, text, len);
    copy[len] = '\0';
    list->pszItem[list->nItem++] = copy;
    return true;
}

void TruncateTo(SZLIST *list, int count) {
    while (list->nItem > count) {
        free(list->pszItem[--list->nItem]);
    }
}

// Leading integer as strtoll reads it; 0 when there is none. Out-of-range values saturate.
long long NumericKey(const char *item) {
    return strtoll(item, nullptr, 10);
}

int CompareItems(const char *a, const char *b, int flags) {
    if ((flags & SZLIST_SORT_NUMERIC) != 0) {
        long long x = NumericKey(a);
        long long y = NumericKey(b);
        return x < y ? -1 : (x > y ? 1 : 0);
    }
    if ((flags & SZLIST_SORT_CASE_INSENSITIVE) != 0) {
        return strcasecmp(a, b);
    }
    return strcmp(a, b);
}

}  // namespace

extern "C" {

PSZLIST VLIBCSzListAlloc(int capacity) {
    if (capacity < 1) {
        capacity = 1;
    }
    auto *list = static_cast<SZLIST *>(calloc(1, sizeof(SZLIST)));
    if (list == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_NO_MEMORY);
        return nullptr;
    }
    list->pszItem = static_cast<char **>(calloc(static_cast<size_t>(capacity), sizeof(char *)));
    if (list->pszItem == nullptr) {
        free(list);
        QUIB_SET_ERR(QUIB_ERR_NO_MEMORY);
        return nullptr;
    }
    list->nAlloc = capacity;
    return list;
}

void VLIBCSzListFree(PSZLIST list) {
    if (list == nullptr) {
        return;
    }
    if (IsUsable(list)) {
        TruncateTo(list, 0);
    }
    free(list->pszItem);
    free(list);
}

int VLIBCSzListPush(PSZLIST *plist, const char *item) {
    if (plist == nullptr || !IsUsable(*plist) || item == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    if (!Append(*plist, item, strlen(item))) {
        QUIB_SET_ERR(QUIB_ERR_NO_MEMORY);
        return -1;
    }
    return 0;
}

const char *VLIBCSzListGet(const PSZLIST list, int index) {
    if (!IsUsable(list) || index < 0 || index >= list->nItem) {
        return nullptr;
    }
    return list->pszItem[index];
}

void VLIBCSzListRemoveAll(PSZLIST list) {
    if (IsUsable(list)) {
        TruncateTo(list, 0);
    }
}

int VLIBCSzListSortItems(PSZLIST list, int flags) {
    bool bothCases = (flags & SZLIST_SORT_CASE_SENSITIVE) != 0 && (flags & SZLIST_SORT_CASE_INSENSITIVE) != 0;
    if (!IsUsable(list) || (flags & ~kKnownSortFlags) != 0 || bothCases) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return norvo::platform::Guarded(-1, [&] {
        char **begin = list->pszItem;
        char **end = list->pszItem + list->nItem;
        // Descending order reverses the comparison rather than the result, so equal items
        // keep their input order both ways.
        bool descending = (flags & SZLIST_SORT_DESC) != 0;
        std::stable_sort(begin, end, [flags, descending](const char *a, const char *b) {
            return descending ? CompareItems(b, a, flags) < 0 : CompareItems(a, b, flags) < 0;
        });
        return 0;
    });
}

int VLIBCSzListCount(const PSZLIST list) {
    return IsUsable(list) ? list->nItem : 0;
}

int VLIBCStrTok(const char *text, const char *delims, PSZLIST *plist) {
    if (text == nullptr || delims == nullptr || plist == nullptr || !IsUsable(*plist)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    SZLIST *list = *plist;
    int before = list->nItem;
    const char *p = text;
    while (*p != '\0') {
        size_t skip = strspn(p, delims);
        p += skip;
        size_t len = strcspn(p, delims);
        if (len == 0) {
            continue;
        }
        if (list->nItem == INT_MAX || !Append(list, p, len)) {
            // All or nothing: the caller never sees half a split.
            TruncateTo(list, before);
            QUIB_SET_ERR(QUIB_ERR_NO_MEMORY);
            return -1;
        }
        p += len;
    }
    return list->nItem - before;
}

}  // extern "C"
