// User-visible paths ("/share/dir/file", "/home/...", "/homes/<user>/...") and real paths,
// and the share privilege of a user.
#pragma once
#include <string>

#include "norvo/export.h"
#include "quib_stat.h"
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

// ---- The directory walker ----
//
// Visits every entry below a directory and hands each, with its stat record (a final link is
// described, never followed), to a callback, keeping the user path and the real path side by
// side. Each directory is opened relative to the one holding it and must not be a link, so a
// folder swapped for a link mid-walk ends that branch instead of leading out of the tree; only
// a bounded number of descriptors is held at any depth. The walker changes the working
// directory into each directory it opens and does not restore it.

// Which failures a walk passes over silently (any other value: none).
typedef enum _enum_ignore_err_ : int {
    IGNORE_ERR_PERMISSION = 0,  // EACCES and EPERM only
    IGNORE_ERR_ALL = 1,
    IGNORE_ERR_NONE = 2,
} _enum_ignore_err_;

class NORVO_API NvoDirectoryWalkerCallBack {
public:
    // One entry: userPath and realPath are the directory's paths + "/" + name; basePath and
    // extra are the walk's own, unchanged. false stops the walk.
    virtual bool operator()(const std::string &userPath, const std::string &basePath,
                            const std::string &realPath, const std::string &name, _tag_QUIBSTAT_ &stat,
                            const std::string *extra) = 0;
    virtual ~NvoDirectoryWalkerCallBack();
};

class NORVO_API NvoDirectoryWalker {
public:
    // cancel (may be null) stays the caller's: a 1 there stops the walk before the next entry,
    // and the walk then counts as finished.
    NvoDirectoryWalker(_enum_ignore_err_ mode, int *cancel);

    // Depth first, pre before and post after each entry (a directory's after its subtree);
    // either may be null. With skipRecycle, shares' recycle bins are not visited.
    // All three walks: true when finished, cancelled or only passed over failures; false when a
    // callback stopped it, a failure that is not passed over ended it (logged), or realDir is
    // not an absolute path.
    bool Walk(const std::string &userDir, const std::string &basePath, const std::string &realDir,
              NvoDirectoryWalkerCallBack *pre, NvoDirectoryWalkerCallBack *post, const std::string *extra,
              bool skipRecycle);
    // Depth first, one callback before each entry.
    bool Walk_TopDown(const std::string &userDir, const std::string &basePath, const std::string &realDir,
                      NvoDirectoryWalkerCallBack &cb, const std::string *extra, bool skipRecycle);
    // The whole first folder, then (unless firstFolderOnly) each of its sub-folders top-down in
    // reader order. Recycle bins are skipped among the first folder's entries only.
    bool Walk_FirstFolder_First(const std::string &userDir, const std::string &basePath,
                                const std::string &realDir, NvoDirectoryWalkerCallBack &cb,
                                const std::string *extra, bool skipRecycle, bool firstFolderOnly);

private:
    _enum_ignore_err_ mode_;
    int *cancel_;
};
