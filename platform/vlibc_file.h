// Settings files in the appliance's form: one key="value" line per key, '#' starts a comment.
// Writers take an exclusive per-process lock and replace the file by rename; readers need no lock.
// Reading is lenient: spaces around '=', bare values (to the end of the line, trailing spaces
// dropped), 'single' quotes, CRLF, and \" and \\ escapes inside double quotes. When a key appears
// twice, the first line is the one read. Writers keep every other line byte for byte.
// A file path of PATH_MAX bytes or more fails with 0xC300.
#pragma once
#include <stddef.h>
#include "platform_export.h"
#include "vlibc_szlist.h"

QUIB_BEGIN_C

// Copies the value of key (quotes removed) into buf, truncated to size-1 bytes (size 0 with a
// null buf only measures). Returns the value's full length + 1 (>0) when found, 0 when the key
// is absent (0x0900 set), -1 on failure (file missing or unreadable: 0x0900; bad argument:
// 0x0D00). flags: 0 = exact key match; 1 = key match ignoring ASCII case.
QUIB_API int VLIBCFileGetKeyValue(const char *file, const char *key, char *buf, size_t size, int flags);
// Sets key to value, replacing its first line (later duplicates are dropped) or appending one;
// creates the file (mode 0644) if missing. The file is rewritten through a temporary in its
// directory and renamed, keeping its owner and mode (a symbolic link is followed and kept), so
// readers never see half a file. format: 0 writes key="value" (\" and \\ escaped); 1 writes
// key=value. 0 on success; -1 with 0x0D00 for a key with white space, '=' or a leading '#', a
// value with a line break or invalid UTF-8, or a bare value that would not read back the same;
// otherwise the errno of the failure translated (0x0300 also when the owner can't be kept).
QUIB_API int VLIBCFileSetKeyValue(const char *file, const char *key, const char *value, int format);
// Removes every line of key. 0 when removed or absent (the file is then left untouched);
// -1 on failure (0x0900 when the file is missing).
QUIB_API int VLIBCFileRemoveKey(const char *file, const char *key);
// 1 when key holds exactly value, 0 when not or absent, -1 on failure (0x0900 file missing).
// flags 1 ignores ASCII case in both key and value.
QUIB_API int VLIBCFileCheckKeyValue(const char *file, const char *key, const char *value, int flags);
// Appends every key of the file, once, to *keys and the value readers see to *values (same
// index; values may be null), in file order. Returns the number of keys; -1 on failure, and
// then nothing is appended.
QUIB_API int VLIBCFileGetKeys(const char *file, PSZLIST *keys, PSZLIST *values);

QUIB_END_C

// The hash form: sets every key of the file in hash to the value readers see (the first line
// of a key counts; keys enter in file order). flags must be 0 and separator "=", the one this
// format has. Returns the number of keys (0 for none); -1 on failure (0x0900 file missing or
// unreadable, 0x0D00 bad argument, 0x2B00), and then the hash is unchanged.
QUIB_API int VLIBCFileGetKeys(const char *file, int flags, PSZHASH hash, const char *separator);
