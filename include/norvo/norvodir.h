// User-visible paths ("/share/dir/file", "/home/...", "/homes/<user>/...") and real paths,
// and the share privilege of a user.
#pragma once
#include <string>

#include "norvo/export.h"
#include "vlibc_szlist.h"

NORVO_BEGIN_C

// A new copy of the first (first != 0) or last component of path; null on failure (null path,
// no "/" at all, or only slashes). Empty components are skipped. The caller frees it.
NORVO_API char *NvoLibGetTokOfPath(const char *path, int first);

// Real path of a share path into out (size bytes, truncated): the share's real path followed
// by the text after the share name. 0 on success; -1 with the platform error set (0xD00 bad
// argument, 0x8100 no share component, 0x1400 no such share).
NORVO_API int NvoLibTransFullPath(const char *path, char *out, int size);

// Resolves a user-visible path for user: the full real path, the share name (first
// component), the volume path (/volume1) and the share's real path. "/home/..." resolves to
// the user's own home, which is created when missing. 1 on success; 0 with the error slot
// set (400 bad argument, 401 no share component or lookup failure, 408 no such share, and the
// codes of NvoUserHomeFullPathGet).
NORVO_API int NvoFullPathGet(const char *path, std::string &fullPath, std::string &shareName,
                             std::string &volumePath, std::string &sharePath, const std::string &user);

// The resolved real path of user's home folder, created (with parents, mode 0755, owned by the
// user) when missing. 1 on success; 0 with 403 (unknown user), 408 (home service off, or the
// folder can't be created) or the codes of NvoLibRealFullPathGet.
NORVO_API int NvoUserHomeFullPathGet(std::string &homePath, const std::string &user);

// realpath of path into out (size bytes). 1 on success; 0 with 400 (bad argument), 408
// (ENOENT), 407 (EACCES) or 401.
NORVO_API int NvoLibRealFullPathGet(const char *path, char *out, int size);

// 1 when name (a share name or a user-visible path) denotes a home folder: "home", "/home",
// "/home/..."; "/homes/<user>..." only when asked with that user. Else 0.
NORVO_API int IsDirUserHome(const std::string &name, const char *user);

// The share privilege of user on the share of path (0 none, 1 read-only, 2 read-write) into
// *priv and the share's restriction flags into *flags (0 for administrators). Domain and
// directory accounts are asked through the platform when sid is given. 0 on success; -1 with
// 401 (bad argument, failed lookup), 408 (no such share), 402 or 406 (domain lookup).
NORVO_API int NvoLibGetPrivilege(const char *path, const char *user, const char *sid, int *priv,
                                 unsigned int *flags);
// 1 when user's share privilege on path is exactly expected, 0 when not, -1 on failure.
NORVO_API int NvoLibHasPrivilege(const char *path, const char *user, const char *sid, int expected);
// The names of the visible shares user may read (or, with writableOnly, write), in share
// order or sorted case-insensitively when sort is non-zero. A new list the caller frees with
// VLIBCSzListFree; null with 401 on failure.
NORVO_API PSZLIST NvoLibValidShareGen(const char *user, int sort, int writableOnly);

NORVO_END_C
