// Growable lists of owned strings, and the tokenizer that fills them.
#pragma once
#include <stddef.h>
#include "platform_export.h"

typedef struct _tag_SZLIST_ {
    int nAlloc;  // slots allocated
    int nItem;   // slots in use
    char **pszItem;
} SZLIST, *PSZLIST;

// Sort flags for VLIBCSzListSortItems. Without a case or numeric flag the order is plain byte
// order (strcmp). NUMERIC orders by the leading integer (strtoll; none counts as 0). DESC reverses
// the order; equal items keep their input order either way.
enum {
    SZLIST_SORT_DESC = 0x01,
    SZLIST_SORT_NUMERIC = 0x02,
    SZLIST_SORT_CASE_SENSITIVE = 0x04,
    SZLIST_SORT_CASE_INSENSITIVE = 0x10,  // the default order for share names
};

QUIB_BEGIN_C

// A new empty list with room for capacity items (at least 1); null on failure with 0x2B00.
// Free with VLIBCSzListFree.
QUIB_API PSZLIST VLIBCSzListAlloc(int capacity);
// Frees the list and every string in it; null is ignored.
QUIB_API void VLIBCSzListFree(PSZLIST list);
// Appends a copy of item, growing the list (*plist may move). 0 on success; -1 with 0x0D00 when
// plist, *plist or item is null, 0x2B00 when out of memory.
QUIB_API int VLIBCSzListPush(PSZLIST *plist, const char *item);
// The item at index, or null when out of range. The list keeps ownership.
QUIB_API const char *VLIBCSzListGet(const PSZLIST list, int index);
// Removes every item; the capacity stays.
QUIB_API void VLIBCSzListRemoveAll(PSZLIST list);
// Sorts in place by the SZLIST_SORT_* flags (stable). 0 on success; -1 with 0x0D00 for a null
// list, an unknown flag, or both case flags at once.
QUIB_API int VLIBCSzListSortItems(PSZLIST list, int flags);
// Number of items (0 for null).
QUIB_API int VLIBCSzListCount(const PSZLIST list);

// Splits text at any byte of delims, dropping empty pieces, and appends the pieces to *plist
// (empty delims: text is one piece). Returns the number of pieces appended; -1 with 0x0D00 on a
// null argument, 0x2B00 when out of memory, and then nothing is appended.
QUIB_API int VLIBCStrTok(const char *text, const char *delims, PSZLIST *plist);

QUIB_END_C
