// Owning handles for platform records and C resources, so each is released on every path.
#pragma once
#include <dirent.h>
#include <stdlib.h>

#include <memory>

#include "quib_share.h"
#include "quib_user.h"
#include "vlibc_szlist.h"

namespace norvo {

struct ShareFree {
    void operator()(PQUIBSHARE s) const { QUIBShareFree(s); }
};
struct UserFree {
    void operator()(PQUIBUSER u) const { QUIBUserFree(u); }
};
struct SzListFree {
    void operator()(PSZLIST l) const { VLIBCSzListFree(l); }
};
struct ShareDBClose {
    void operator()(PQUIBSHARE_DB db) const { QUIBShareDBClose(db); }
};
struct MallocFree {
    void operator()(void *p) const { free(p); }
};
struct DirClose {
    void operator()(DIR *d) const { closedir(d); }
};

using ShareRecord = std::unique_ptr<QUIBSHARE, ShareFree>;
using UserRecord = std::unique_ptr<QUIBUSER, UserFree>;
using SzList = std::unique_ptr<SZLIST, SzListFree>;
using ShareDB = std::unique_ptr<QUIBSHARE_DB, ShareDBClose>;
using CString = std::unique_ptr<char, MallocFree>;
using DirHandle = std::unique_ptr<DIR, DirClose>;

// A platform lookup that fills a raw pointer, wrapped: returns the record or null.
inline ShareRecord GetShare(const char *name) {
    PQUIBSHARE raw = nullptr;
    if (QUIBShareGet(name, &raw) < 0) {
        return ShareRecord(nullptr);
    }
    return ShareRecord(raw);
}

inline UserRecord GetUser(const char *name) {
    PQUIBUSER raw = nullptr;
    if (QUIBUserGet(name, &raw) < 0) {
        return UserRecord(nullptr);
    }
    return UserRecord(raw);
}

}  // namespace norvo
