// String and name utilities; permission conversions, ACL checks, and the share-level list,
// download and upload checks.
#pragma once
#include <string>
#include <vector>

#include <json/value.h>

#include "norvo/export.h"

// Mode digits ("rwxr-x---" or 0750 give 750): the octal digits read as a decimal number.
NORVO_API int GetPrivilege(const char *mode);
NORVO_API int GetPrivilege(unsigned int mode);
// The nine-character permission string of a mode ("rwxr-xr-x").
NORVO_API std::string GetPrivilegeStr(unsigned int mode);
// The ACL permission mask of path for the effective identity; 8191 (all) when it can't be read.
NORVO_API unsigned int GetACLPrivilege(const char *path);
// 0 when the effective identity may do what request asks on path (bits 0x1 read, 0x2 write,
// 0x4 execute, 0x8 delete, 0x10 append), -1 when not (407) or on failure (408, 411).
NORVO_API int ACLAccess(const char *path, int request);
// 1 when the directory can be entered and opened, else 0 with 402, 407 or 408. Changes the
// process's working directory to it.
NORVO_API int CheckDirListPrivilege(const char *path);

NORVO_BEGIN_C

// 1 when user may list the user-visible path, 0 when not.
NORVO_API int CheckShareListPrivilege(const char *user, const char *sid, const char *path);
// 1 when user may download from the user-visible path, 0 when not (407 set).
NORVO_API int CheckShareDownloadPrivilege(const char *user, const char *sid, const char *path);
// 1 when user may upload to the user-visible path. *type (in/out) is the upload type: a share
// with restriction flags forces 2; with type 0 an existing target is refused (414).
NORVO_API int CheckShareUploadPrivilege(const char *user, const char *sid, const char *path, int *type);
// 1 when the file system under the real path is one the file manager supports, else 0.
NORVO_API int NvoLibFileSystemSupported(const char *path);
// *encrypted = whether the share is encrypted. 1 on success; 0 with 408 when there is no such
// share. Home shares are never encrypted.
NORVO_API int NvoLibCheckEncryptShare(const std::string &share, bool *encrypted);

NORVO_END_C

// ---- String and name utilities ----

NORVO_BEGIN_C

// 1 when subject matches pattern as a whole, else 0: "*" any run, "?" one character, esc makes
// the next pattern character literal; UTF-8 code points compared after ICU default case folding.
// Worst case bounded by pattern length times subject length.
NORVO_API int NvoLibStrLikeCompare(const char *pattern, const char *subject, int esc);
// *out = src with every non-overlapping occurrence of from replaced by to, scanning left to right
// (inserted text is not searched again). 1 replaced, 0 nothing found (*out a copy), -1 for a null
// or empty argument or no memory. The caller frees *out.
NORVO_API int NvoLibStrReplace(const char *src, const char *from, const char *to, char **out);
// The same with two pairs, tried in one left-to-right scan, from1 before from2 at each position.
NORVO_API int NvoLibTwoStrReplace(const char *src, const char *from1, const char *to1, const char *from2,
                                  const char *to2, char **out);
// Lower-cases every byte in place (tolower). 0, or -1 for null.
NORVO_API int NvoLibStringToLower(char *text);
// Pointer into name just after the extension's dot, or null (no extension, a leading dot only,
// a trailing dot, a name shorter than 2). The scan starts at start when 1 < start < length.
NORVO_API const char *ReturnFileExt(const char *name, int start);
// Writes size as "N Bytes", "N KB", "N MB" or "N GB" ("%5.2f" with fraction). 1 written, 0 not
// (null buffer, len <= 0, size <= 0).
NORVO_API int FileUnitGet(long long size, char *buf, int len, bool fraction);
// 1 when text is well formed by the UTF-8 lead-byte rules (null and empty count), else 0.
NORVO_API int IsUnicodeString(const char *text);
// 1 and out = the elements' paths (from their first "/") joined by ", "; 0 with 401 when value is
// not an array.
NORVO_API int ParseJsonPathToString(const Json::Value &value, std::string &out);
// out = the icon file name of a listed entry ("misc.png", "<ext>.png", "folder.png",
// "isomountpoint.png", "remotemountpoint.png", "recycle_bin.png"). realPath is the entry's real
// path, sharePath its path within the share.
NORVO_API void GetImgFileExt(const char *name, bool isDir, std::string &out, const std::string &realPath,
                             const std::string &sharePath);
// out = the file names of text's delim-separated paths, joined by sep. An empty delim leaves out.
NORVO_API void StringExplodeToFileNameString(std::string &out, const std::string &text, const char *delim,
                                             const char *sep);

NORVO_END_C

// The bytes of hex decoded two characters at a time, up to the first zero byte.
NORVO_API std::string NvoLibHex2Bin(const char *hex);
// Splits text at delim: no leading empty piece for a delimiter at index 0, empty pieces between
// adjacent delimiters kept, the rest after the last delimiter always pushed. An empty delim does
// nothing.
NORVO_API void StringExplode(std::vector<std::string> &out, const std::string &text, const char *delim);
NORVO_API void StringExplode(const std::string &text, const char *delim, void (*callback)(const std::string &, void *),
                             void *user);
// The longest common parent directory of paths, ending in "/", or "".
NORVO_API std::string FindCommonParent(std::vector<std::string> paths);
