// Owning handles for platform records and C resources, so each is released on every path.
#pragma once
#include <dirent.h>
#include <stdlib.h>

#include <memory>

#include "quib_dir_pass.h"
#include "quib_sdk_share.h"
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
struct GroupFree {
    void operator()(PQUIBGROUP g) const { QUIBGroupFree(g); }
};
struct UserDBClose {
    void operator()(PQUIBUSER_DB db) const { QUIBUserDBClose(db); }
};
struct GroupDBClose {
    void operator()(PQUIBGROUP_DB db) const { QUIBGroupDBClose(db); }
};
struct MallocFree {
    void operator()(void *p) const { free(p); }
};
struct SdkShareRelease {
    void operator()(SDK::Share *s) const { SDK::Share::Release(s); }
};
struct DirClose {
    void operator()(DIR *d) const { closedir(d); }
};
struct DirPassEnd {
    void operator()(QUIBDirPass *p) const { QUIBDirPassEnd(p); }
};

using ShareRecord = std::unique_ptr<QUIBSHARE, ShareFree>;
using UserRecord = std::unique_ptr<QUIBUSER, UserFree>;
using SzList = std::unique_ptr<SZLIST, SzListFree>;
using ShareDB = std::unique_ptr<QUIBSHARE_DB, ShareDBClose>;
using GroupRecord = std::unique_ptr<QUIBGROUP, GroupFree>;
using UserDB = std::unique_ptr<QUIBUSER_DB, UserDBClose>;
using GroupDB = std::unique_ptr<QUIBGROUP_DB, GroupDBClose>;
using CString = std::unique_ptr<char, MallocFree>;
using DirHandle = std::unique_ptr<DIR, DirClose>;
using DirPass = std::unique_ptr<QUIBDirPass, DirPassEnd>;
using SdkShare = std::unique_ptr<SDK::Share, SdkShareRelease>;

// The record slot a platform cursor refills in place: the cursor frees the record passed in
// and leaves the last one to the caller, which this frees whatever way the walk ends.
template <typename Record, void (*Free)(Record *)>
class CursorSlot {
public:
    CursorSlot() = default;
    ~CursorSlot() { Free(record_); }
    CursorSlot(const CursorSlot &) = delete;
    CursorSlot &operator=(const CursorSlot &) = delete;

    Record **Out() { return &record_; }
    Record *operator->() const { return record_; }

private:
    Record *record_ = nullptr;
};
using UserCursorSlot = CursorSlot<QUIBUSER, QUIBUserFree>;
using GroupCursorSlot = CursorSlot<QUIBGROUP, QUIBGroupFree>;

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
