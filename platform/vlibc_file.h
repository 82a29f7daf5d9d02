// Settings files in the appliance's form: one key="value" line per key, '#' starts a comment.
// Readers take a shared flock and writers an exclusive one, on the file itself.
#pragma once
#include <stddef.h>
#include "platform_export.h"
#include "vlibc_szlist.h"

QUIB_BEGIN_C

// Copies the value of key (quotes removed) into buf, truncated to size-1 bytes.
// Returns the value's full length + 1 (>0) when found, 0 when the key is absent (0x0900 set),
// -1 on failure (file missing or unreadable: 0x0900; bad argument: 0x0D00).
// flags: 0 = exact key match; 1 = key match ignoring case.
QUIB_API int VLIBCFileGetKeyValue(const char *file, const char *key, char *buf, size_t size, int flags);
// Sets key to value, replacing its line or appending one; creates the file (mode 0644) if missing.
// The file is rewritten through a temporary and renamed, so readers never see half a file.
// format: 0 writes key="value"; 1 writes key=value. 0 on success, -1 on failure.
QUIB_API int VLIBCFileSetKeyValue(const char *file, const char *key, const char *value, int format);
// Removes key's line. 0 when removed or absent, -1 on failure.
QUIB_API int VLIBCFileRemoveKey(const char *file, const char *key);
// 1 when key holds exactly value (case-insensitive when flags is 1), 0 when not or absent, -1 on failure.
QUIB_API int VLIBCFileCheckKeyValue(const char *file, const char *key, const char *value, int flags);
// Appends every key of the file to *keys and its value to *values (same index), in file order.
// Returns the number of keys, -1 on failure.
QUIB_API int VLIBCFileGetKeys(const char *file, PSZLIST *keys, PSZLIST *values);

QUIB_END_C
