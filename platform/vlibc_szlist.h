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

// A string hash: owned keys, each with one owned value, enumerated in the order they were
// first set. Made by VLIBCSzHashAlloc, freed by VLIBCSzHashFree.
typedef struct _tag_SZHASH_ SZHASH, *PSZHASH;

// A new empty hash sized for about size keys (it grows past that); null with 0x2B00.
QUIB_API PSZHASH VLIBCSzHashAlloc(int size);
// Frees the hash, its keys and values; null is ignored.
QUIB_API void VLIBCSzHashFree(PSZHASH hash);
// Sets key to a copy of value (a key set again keeps its place). 0; -1 with 0x0D00 for a null
// argument, 0x2B00 when out of memory (the hash is then unchanged).
QUIB_API int VLIBCSzHashSetValue(PSZHASH hash, const char *key, const char *value);
// The value of key, owned by the hash until it changes; null when absent or for null arguments.
QUIB_API const char *VLIBCSzHashGetValue(PSZHASH hash, const char *key);
// Number of keys (0 for null).
QUIB_API int VLIBCSzHashCount(PSZHASH hash);
// Appends every key to *plist in the order they were first set. Returns how many; -1 with
// 0x0D00 for null arguments or 0x2B00, and then nothing is appended.
QUIB_API int VLIBCSzHashEnumKey(PSZHASH hash, PSZLIST *plist);

QUIB_END_C
