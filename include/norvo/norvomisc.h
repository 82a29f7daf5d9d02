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

// 1 when subject matches pattern as a whole, else 0 (also for a null pattern or subject).
// Both are read as UTF-8 code points without validation: a byte 0xC0..0xF4 leads one to three
// trail bytes, whatever they hold (a sequence cut short by the end is one character); any other
// byte is a character. "*" matches any run, "?" one character, esc (a code point; "*" and "?"
// take precedence over it) makes the next pattern character literal; characters compare after
// ICU's default case folding. After a star the rest is tried only where a subject character is
// left, so a pattern ending in star and escape character matches nothing. No allocation; at
// most (pattern length) x (subject length) steps.
NORVO_API int NvoLibStrLikeCompare(const char *pattern, const char *subject, int esc);
// *out = src with every non-overlapping occurrence of from replaced by to, scanning left to right
// (inserted text is not searched again). 1 replaced; 0 nothing found (*out a copy); -1 with
// *out = null for a null or empty argument (an empty to included), a null out, or no memory
// (logged). The caller frees *out.
NORVO_API int NvoLibStrReplace(const char *src, const char *from, const char *to, char **out);
// The same with two pairs in one left-to-right scan: at each position from1 is tried before
// from2; the scan goes on after each replacement.
NORVO_API int NvoLibTwoStrReplace(const char *src, const char *from1, const char *to1, const char *from2,
                                  const char *to2, char **out);
// Lower-cases every byte in place with tolower (bytes, not code points). 0, or -1 for null.
NORVO_API int NvoLibStringToLower(char *text);
// Pointer into name just after its extension's dot, or null: no dot after index 0 (".profile"
// has none), a trailing dot, a name shorter than 2 or null. The dot is sought backwards from
// start when 1 < start < length, else from the last character.
NORVO_API const char *ReturnFileExt(const char *name, int start);
// Writes size into buf (snprintf, cut to len) as "N Bytes" below 1 KiB, else in the largest of
// KB, MB, GB that holds at least one: "%5.2f KB" with fraction, the value truncated ("%lld KB")
// without. 1 written; 0 and buf untouched for a null buf, len <= 0 or size <= 0.
NORVO_API int FileUnitGet(long long size, char *buf, int len, bool fraction);
// 1 when every byte with the high bit set starts a sequence of the original UTF-8 lead-byte
// rules (up to six bytes; overlong forms and surrogates pass) completed by 10xxxxxx bytes, and
// for null or empty text; else 0.
NORVO_API int IsUnicodeString(const char *text);
// 1 and out = the elements' texts joined by ", ", each from its first "/" when it has one
// (arrays and objects count as ""). 0 with 401 (logged) and out untouched when value is not an
// array.
NORVO_API int ParseJsonPathToString(const Json::Value &value, std::string &out);
// out = the icon file name of a listed entry; "misc.png" for a null name. A file: "<ext>.png"
// (the extension lower-cased) when "../images/files_ext/<ext>.png" exists relative to the
// working directory, else "misc.png". A directory: at a mount point "isomountpoint.png" (disk
// image) or "remotemountpoint.png" (network), else "folder.png"; a folder that is no mount
// point and whose sharePath (its path within the share, "/#recycle" or "#recycle") is the single
// component "#recycle" gets "recycle_bin.png". realPath is the entry's real path.
NORVO_API void GetImgFileExt(const char *name, bool isDir, std::string &out, const std::string &realPath,
                             const std::string &sharePath);
// out = the file names (after the last "/") of text's pieces split as by StringExplode, joined by
// sep (null: none). An empty or null delim leaves out as it was.
NORVO_API void StringExplodeToFileNameString(std::string &out, const std::string &text, const char *delim,
                                             const char *sep);

NORVO_END_C

// The bytes of hex decoded two characters at a time with strtol (a trailing odd character is
// ignored), up to the first zero byte. "" for null.
NORVO_API std::string NvoLibHex2Bin(const char *hex);
// Appends the pieces of text between occurrences of delim: no empty first piece for a delimiter
// at index 0, empty pieces between adjacent delimiters kept, the rest after the last delimiter always
// appended (text whole when it has none). An empty or null delim does nothing.
NORVO_API void StringExplode(std::vector<std::string> &out, const std::string &text, const char *delim);
// The same pieces, each passed to callback with user instead; nothing for a null callback.
NORVO_API void StringExplode(const std::string &text, const char *delim,
                             void (*callback)(const std::string &, void *), void *user);
// The longest common parent directory of paths (each taken with a trailing "/"), ending in "/";
// "" for no paths or only empty ones. Paths without a common leading directory give their
// common prefix as it is ("ab" and "ac" give "a").
NORVO_API std::string FindCommonParent(std::vector<std::string> paths);

// ---- Transfer log and the device's address ----

// The kinds of logged transfers; any other value is never logged. The type is fixed, so any int
// a caller passes is a value of it.
enum NORVO_ACTIONS : int {
    NORVO_ACTION_DOWNLOAD = 1,       // "download"
    NORVO_ACTION_UPLOAD = 2,         // "upload"
    NORVO_ACTION_DELETE = 3,         // "delete"
    NORVO_ACTION_RENAME = 4,         // "rename"
    NORVO_ACTION_COPY = 5,           // "copy"
    NORVO_ACTION_MOVE = 6,           // "move"
    NORVO_ACTION_PROPERTY_SET = 7,   // "property set"
    NORVO_ACTION_MKDIR = 8,          // "mkdir"
    NORVO_ACTION_DOWNLOAD_TEST = 9,  // "download test"
};

// NvoLibDoFileBrowserLog when the setting "filebrowserxferlog" is "yes" (any case); else 0.
NORVO_API int NvoLibDoLog(const std::string &user, const std::string &path, long long size,
                          NORVO_ACTIONS action, bool isDir);
// One transfer record (QUIBLogOBXFMXferLog) with the client address of "REMOTE_ADDR": 1 when
// written; 0 for an empty user, path or address (logged), an action outside 1..9, or a failed
// write (logged).
NORVO_API int NvoLibDoFileBrowserLog(const std::string &user, const std::string &path, long long size,
                                     NORVO_ACTIONS action, bool isDir);
// out = the device's address as the client sees it, "scheme://host[:port]": https when "HTTPS"
// is "on"; the host from "external_host_ip", else the selected dynamic-DNS entry (when the
// device supports it and "ddns_update" is "yes"), else "HTTP_HOST"; the port from
// "external_port_obx_http(s)" when set, else "HTTP_HOST". A host or port from "HTTP_HOST" with
// characters no host name or port has is left out. Returns out.
NORVO_API std::string &GetRemoteAddr(std::string &out);
