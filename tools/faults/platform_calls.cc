// The platform's entry points that take a resource or can fail for a reason outside the caller.
// A failing one returns its documented failure value with errno and the error slot set from
// the armed error. Those that hand out a record, cursor, list, pass or share object enter it in
// the record book; those that release one strike it out.
#include <string.h>

#include <json/value.h>

#include "quib_autoblock.h"
#include "quib_cgi.h"
#include "quib_db.h"

#include "fileidx.h"
#include "quib_dir_pass.h"
#include "quib_file_copy.h"
#include "quib_fs.h"
#include "quib_log.h"
#include "quib_login.h"
#include "quib_s2s.h"
#include "quib_sdk_share.h"
#include "quib_share.h"
#include "quib_share_list.h"
#include "quib_stat.h"
#include "quib_user.h"
#include "quib_webapi.h"
#include "quib_webutils.h"
#include "vlibc_exec.h"
#include "vlibc_file.h"
#include "vlibc_line_file.h"
#include "vlibc_support.h"
#include "vlibc_szlist.h"

#include "seam.h"

namespace seam = norvo::faults::seam;
using seam::ShouldFailPlatform;

#define SEAM_PLATFORM(type, fn, failure, params, args)          \
    type fn params {                                            \
        SEAM_REAL(fn);                                          \
        return ShouldFailPlatform(#fn) ? (failure) : real args; \
    }

// Calls that take no record.
SEAM_PLATFORM(int, BlSDKUserIsInList, -1, (const char *user, const char *list), (user, list))
SEAM_PLATFORM(int, QUIBUserGetUGID, -1, (const char *name, uid_t *uid, gid_t *gid), (name, uid, gid))
SEAM_PLATFORM(int, QUIBUserIsExpired, -1, (const char *name), (name))
SEAM_PLATFORM(int, QUIBGroupGetGID, -1, (const char *name, gid_t *gid), (name, gid))
SEAM_PLATFORM(int, QUIBGroupIsMember, -1, (const char *group, const char *user), (group, user))
SEAM_PLATFORM(int, QUIBGroupIsAdminGroupMem, -1, (const char *user), (user))
SEAM_PLATFORM(int, QUIBGroupIsAdminGroupMemEx, -1, (const char *user, int withDomain), (user, withDomain))
SEAM_PLATFORM(int, QUIBServiceUserHomeIsEnabled, 0, (const PQUIBUSER user), (user))
SEAM_PLATFORM(int, QUIBServiceHomePathGet, -1, (const char *user, char *buf, int size), (user, buf, size))
SEAM_PLATFORM(int, VLIBUserPrivilegeHas, 0, (const char *user, const char *priv), (user, priv))
SEAM_PLATFORM(int, QuibCgiDomGetPrivilege, -1,
              (const char *share, const char *user, const char *sid, int *priv), (share, user, sid, priv))
SEAM_PLATFORM(int, QuibCgiLDAPGetPrivilege, -1,
              (const char *share, const char *user, const char *sid, int *priv), (share, user, sid, priv))
SEAM_PLATFORM(uid_t, QuibCgiUIDGet, static_cast<uid_t>(-1), (const char *sid, const char *user), (sid, user))
SEAM_PLATFORM(gid_t, QuibCgiGIDGet, static_cast<gid_t>(-1), (const char *sid, const char *user), (sid, user))
SEAM_PLATFORM(int, QUIBLoginCreate, -1,
              (const char *user, const char *password, const char *remoteAddr, char *sidBuf, int sidSize),
              (user, password, remoteAddr, sidBuf, sidSize))
SEAM_PLATFORM(int, QUIBLoginGet, -1, (const char *sid, char *userBuf, int userSize), (sid, userBuf, userSize))
SEAM_PLATFORM(int, QUIBLoginRemove, -1, (const char *sid), (sid))
SEAM_PLATFORM(int, QUIBS2SIsSyncedShare, -1, (const char *name), (name))
SEAM_PLATFORM(int, QUIBGetFSType, -1, (const char *path, int flags), (path, flags))
SEAM_PLATFORM(int, QUIBFileCopy, -1, (const char *src, const char *dst, const QUIB_FILECOPY_OPT *options),
              (src, dst, options))
SEAM_PLATFORM(int, QUIBLogOBXFMXferLog, -1,
              (const char *ip, const char *user, const char *action, long long size, const char *path,
               int isDir),
              (ip, user, action, size, path, isDir))
SEAM_PLATFORM(int, QUIBDDNSConfigGet, -1, (const char *name, PQUIB_DDNS_CONFIG config), (name, config))
SEAM_PLATFORM(int, QuibConf, -1, (const char *key, const char *defaultValue, char *buf, size_t size),
              (key, defaultValue, buf, size))
SEAM_PLATFORM(int, QUIBFSIsInMountTable, -1, (const char *path), (path))
SEAM_PLATFORM(int, QUIBShareIsShareRecycle, -1, (const char *realPath), (realPath))
SEAM_PLATFORM(int, QUIBACLPermGet, -1, (const char *path, unsigned int *mask), (path, mask))
SEAM_PLATFORM(int, QUIBACLIsSupport, -1, (const char *path, int fd, int flags), (path, fd, flags))
SEAM_PLATFORM(int, VLIBCFileLStat, -1, (const char *path, int flags, PQUIBSTAT st), (path, flags, st))
SEAM_PLATFORM(int, VLIBCFileLStatAt, -1, (int dirFd, const char *name, int flags, PQUIBSTAT st),
              (dirFd, name, flags, st))
SEAM_PLATFORM(int, VLIBCFileGetKeyValue, -1,
              (const char *file, const char *key, char *buf, size_t size, int flags),
              (file, key, buf, size, flags))
SEAM_PLATFORM(int, VLIBCFileSetKeyValue, -1,
              (const char *file, const char *key, const char *value, int format), (file, key, value, format))
SEAM_PLATFORM(int, VLIBCFileRemoveKey, -1, (const char *file, const char *key), (file, key))
SEAM_PLATFORM(int, VLIBCFileCheckKeyValue, -1,
              (const char *file, const char *key, const char *value, int flags), (file, key, value, flags))
SEAM_PLATFORM(int, VLIBCSupportGet, -1, (const char *key), (key))
SEAM_PLATFORM(int, VLIBCSzListSortItems, -1, (PSZLIST list, int flags), (list, flags))
SEAM_PLATFORM(int, VLIBCFileAddLine, -1, (const char *file, const char *line), (file, line))
SEAM_PLATFORM(int, VLIBCFileGetLine, -1, (const char *file, const char *text, char *buf, int size),
              (file, text, buf, size))
SEAM_PLATFORM(int, VLIBCSysRename, -1, (const char *from, const char *to), (from, to))
SEAM_PLATFORM(int, VLIBCConfGetOBXTimeout, -1, (void), ())
SEAM_PLATFORM(int, QuibCgiBeginCriticalSection, -1, (const char *name, int timeoutMs), (name, timeoutMs))
SEAM_PLATFORM(int, QuibCgiGetInCookies, -1, (QuibCgi * cgi, const char *name, char *buf, int size),
              (cgi, name, buf, size))
SEAM_PLATFORM(int, QuibCgiIsDeniedIP, -1, (const char *ip), (ip))
SEAM_PLATFORM(int, AutoBlockFailLoginSet, -1, (const char *ip, const char *service), (ip, service))
SEAM_PLATFORM(int, QUIBAutoBlockResetByIP, -1, (const char *ip), (ip))
SEAM_PLATFORM(char, QUIBUserRandomNumMap2Seed, '\0', (long num), (num))

int QUIBFSMkdirP(const char *path, char *stopAt, int stopAtSize, int recursive, uid_t uid, gid_t gid,
                 mode_t mode) {
    SEAM_REAL(QUIBFSMkdirP);
    if (!ShouldFailPlatform("QUIBFSMkdirP")) {
        return real(path, stopAt, stopAtSize, recursive, uid, gid, mode);
    }
    if (stopAt != nullptr && stopAtSize > 0) {  // the component that failed: say the whole path
        snprintf(stopAt, static_cast<size_t>(stopAtSize), "%s", path != nullptr ? path : "");
    }
    return -1;
}

SEAM_PLATFORM(int, FILEIDXDBCreate, -1, (const char *dbPath), (dbPath))
SEAM_PLATFORM(int, FILEIDXDBInsert, -1,
              (const char *dbPath, const __tag_FI_FILE_INFO_DATA *records, int count),
              (dbPath, records, count))
SEAM_PLATFORM(int, FILEIDXDBSelect, -1,
              (const char *dbPath, const FI_QUERY *query, FILEIDX_SELECT_CB callback, void *arg,
               const unsigned long long *limit, const unsigned long long *offset, int flags),
              (dbPath, query, callback, arg, limit, offset, flags))
SEAM_PLATFORM(int, FILEIDXCountGet, -1,
              (const char *dbPath, const FI_QUERY *query, unsigned long long *total), (dbPath, query, total))
SEAM_PLATFORM(int, FILEIDXDBUpdate, -1,
              (const char *dbPath, const __tag_FI_SQL_COND *setList, const __tag_FI_SQL_COND *where),
              (dbPath, setList, where))
SEAM_PLATFORM(int, FILEIDXDBDel, -1, (const char *dbPath, const __tag_FI_SQL_COND *where), (dbPath, where))
SEAM_PLATFORM(int, FILEIDXOutputDBInsert, -1, (FI_OUTPUT_DB * db, const __tag_FI_FILE_INFO_DATA *record),
              (db, record))
SEAM_PLATFORM(int, FILEIDXOutputDBCommit, -1, (FI_OUTPUT_DB * db), (db))
SEAM_PLATFORM(int, FILEIDXIsIndexEnable, -1, (const char *volume), (volume))
SEAM_PLATFORM(int, FILEIDXResultGetAndTableGen, -1,
              (const char *volume, const __tag_FI_SQL_COND *conditions,
               const __tag_FI_SQL_COND *folderConditions, FILEIDX_ROW_FILTER filter,
               const FI_TABLE_GEN_CONTEXT *context),
              (volume, conditions, folderConditions, filter, context))
SEAM_PLATFORM(int, VLIBCExec, -1, (const char *program, const char *const argv[]), (program, argv))

// An output database is a record from Open to Close; Close always frees it.
int FILEIDXOutputDBOpen(const char *dbPath, FI_OUTPUT_DB **out) {
    SEAM_REAL(FILEIDXOutputDBOpen);
    if (ShouldFailPlatform("FILEIDXOutputDBOpen")) {
        if (out != nullptr) {
            *out = nullptr;
        }
        return -1;
    }
    const int rc = real(dbPath, out);
    if (rc == 0) {
        seam::Track(*out, "FILEIDXOutputDBOpen");
    }
    return rc;
}

int FILEIDXOutputDBClose(FI_OUTPUT_DB *db) {
    SEAM_REAL(FILEIDXOutputDBClose);
    seam::Untrack(db);
    return real(db);
}

// Calls that hand out a record: entered on success.
#define SEAM_MAKER(type, fn, params, args, record) \
    type fn params {                               \
        SEAM_REAL(fn);                             \
        if (ShouldFailPlatform(#fn)) {             \
            return static_cast<type>(-1);          \
        }                                          \
        const type rc = real args;                 \
        if (rc == 0) {                             \
            seam::Track(record, #fn);              \
        }                                          \
        return rc;                                 \
    }
SEAM_MAKER(int, QUIBShareGet, (const char *name, PQUIBSHARE *pshare), (name, pshare), *pshare)
SEAM_MAKER(int, QUIBUserGet, (const char *name, PQUIBUSER *puser), (name, puser), *puser)
SEAM_MAKER(int, QUIBUserGetByUID, (uid_t uid, PQUIBUSER *puser, int noCache), (uid, puser, noCache), *puser)
SEAM_MAKER(int, QUIBGroupGet, (const char *name, PQUIBGROUP *pgroup), (name, pgroup), *pgroup)
SEAM_MAKER(int, QUIBGroupGetByGID, (gid_t gid, PQUIBGROUP *pgroup, int noCache), (gid, pgroup, noCache),
           *pgroup)

// Calls that hand out a new object or null.
#define SEAM_OPENER(type, fn, params, args) \
    type fn params {                        \
        SEAM_REAL(fn);                      \
        if (ShouldFailPlatform(#fn)) {      \
            return nullptr;                 \
        }                                   \
        type made = real args;              \
        seam::Track(made, #fn);             \
        return made;                        \
    }
SEAM_OPENER(PQUIBSHARE_DB, QUIBShareDBOpen, (void), ())
SEAM_OPENER(PQUIBUSER_DB, QUIBUserDBOpen, (void), ())
SEAM_OPENER(PQUIBGROUP_DB, QUIBGroupDBOpen, (void), ())
SEAM_OPENER(PSZLIST, VLIBCSzListAlloc, (int capacity), (capacity))
SEAM_OPENER(PSZLIST, QuibCgiDomValidShareGen, (const char *context, const char *user, int sort, int writable),
            (context, user, sort, writable))
SEAM_OPENER(PSZLIST, QuibCgiLDAPValidShareGen,
            (const char *context, const char *user, int sort, int writable), (context, user, sort, writable))
SEAM_OPENER(QUIBDirPass *, QUIBDirPassBegin, (const char *dirPath), (dirPath))
SEAM_OPENER(QuibCgi *, QuibCgiAlloc, (const char *recordFile, const char *lockName), (recordFile, lockName))
SEAM_OPENER(PSZHASH, VLIBCSzHashAlloc, (int size), (size))
SEAM_OPENER(PQUIBDB, QUIBDBConnect,
            (const char *host, const char *user, const char *password, const char *path),
            (host, user, password, path))

// Calls that release one.
#define SEAM_RELEASER(type, fn) \
    void fn(type record) {      \
        SEAM_REAL(fn);          \
        seam::Untrack(record);  \
        real(record);           \
    }
SEAM_RELEASER(PQUIBSHARE, QUIBShareFree)
SEAM_RELEASER(PQUIBUSER, QUIBUserFree)
SEAM_RELEASER(PQUIBGROUP, QUIBGroupFree)
SEAM_RELEASER(PQUIBSHARE_DB, QUIBShareDBClose)
SEAM_RELEASER(PQUIBUSER_DB, QUIBUserDBClose)
SEAM_RELEASER(PQUIBGROUP_DB, QUIBGroupDBClose)
SEAM_RELEASER(PSZLIST, VLIBCSzListFree)
SEAM_RELEASER(QUIBDirPass *, QUIBDirPassEnd)
SEAM_RELEASER(QuibCgi *, QuibCgiFree)
SEAM_RELEASER(PSZHASH, VLIBCSzHashFree)
SEAM_RELEASER(PQUIBDB, QUIBDBClose)
SEAM_RELEASER(PQUIBDB_RESULT, QUIBDBFreeResult)

// Calls that refill a caller's slot (a cursor's record, a list that may move as it grows).
#define SEAM_REFILL(fn, slot, params, args)                     \
    int fn params {                                             \
        SEAM_REAL(fn);                                          \
        if (ShouldFailPlatform(#fn)) {                          \
            return -1;                                          \
        }                                                       \
        const void *before = slot != nullptr ? *slot : nullptr; \
        const int rc = real args;                               \
        if (slot != nullptr) {                                  \
            seam::Refilled(before, *slot, #fn);                 \
        }                                                       \
        return rc;                                              \
    }
SEAM_REFILL(QUIBShareDBCursorGet, pshare, (PQUIBSHARE_DB db, PQUIBSHARE *pshare), (db, pshare))
SEAM_REFILL(QUIBUserDBGetByCursor, puser, (PQUIBUSER_DB db, PQUIBUSER *puser, AUTH_TYPE type, int noCache),
            (db, puser, type, noCache))
SEAM_REFILL(QUIBGroupDBGetByCursor, pgroup,
            (PQUIBGROUP_DB db, PQUIBGROUP *pgroup, AUTH_TYPE type, int noCache), (db, pgroup, type, noCache))
SEAM_REFILL(VLIBCSzListPush, plist, (PSZLIST * plist, const char *item), (plist, item))
SEAM_REFILL(VLIBCStrTok, plist, (const char *text, const char *delims, PSZLIST *plist), (text, delims, plist))
SEAM_REFILL(QUIBGroupInfoGetgroupList, plist, (const char *user, PSZLIST *plist, int flags),
            (user, plist, flags))

SEAM_REFILL(VLIBCSzHashEnumKey, plist, (PSZHASH hash, PSZLIST *plist), (hash, plist))

int QUIBDBExecute(PQUIBDB db, const char *sql, PQUIBDB_RESULT *result) {
    SEAM_REAL(QUIBDBExecute);
    if (ShouldFailPlatform("QUIBDBExecute")) {
        if (result != nullptr) {
            *result = nullptr;
        }
        return -1;
    }
    const int rc = real(db, sql, result);
    if (rc == 0) {
        seam::Track(*result, "QUIBDBExecute");
    }
    return rc;
}

int VLIBCFileGetKeys(const char *file, PSZLIST *keys, PSZLIST *values) {
    static const auto real =
        reinterpret_cast<int (*)(const char *, PSZLIST *, PSZLIST *)>(seam::Next("VLIBCFileGetKeys"));
    if (ShouldFailPlatform("VLIBCFileGetKeys")) {
        return -1;
    }
    const void *keysBefore = keys != nullptr ? *keys : nullptr;
    const void *valuesBefore = values != nullptr ? *values : nullptr;
    const int rc = real(file, keys, values);
    if (keys != nullptr) {
        seam::Refilled(keysBefore, *keys, "VLIBCFileGetKeys");
    }
    if (values != nullptr) {
        seam::Refilled(valuesBefore, *values, "VLIBCFileGetKeys");
    }
    return rc;
}

// The C++ entry points, found by their mangled names.
int VLIBCFileGetKeys(const char *file, int flags, PSZHASH hash, const char *separator) {
    static const auto real = reinterpret_cast<int (*)(const char *, int, PSZHASH, const char *)>(
        seam::Next("_Z16VLIBCFileGetKeysPKciP12_tag_SZHASH_S0_"));
    return ShouldFailPlatform("VLIBCFileGetKeys") ? -1 : real(file, flags, hash, separator);
}

std::string WebUtils::GetModifyTime(const std::string &path) {
    static const auto real = reinterpret_cast<std::string (*)(const std::string &)>(
        seam::Next("_ZN8WebUtils13GetModifyTimeERKNSt7__cxx1112basic_stringIcSt11char_traitsIcESaIcEEE"));
    return ShouldFailPlatform("WebUtils::GetModifyTime") ? std::string() : real(path);
}

int QUIB::WebAPIUtil::ParseToArray(const char *value, Json::Value &array) {
    static const auto real = reinterpret_cast<int (*)(const char *, Json::Value &)>(
        seam::Next("_ZN4QUIB10WebAPIUtil12ParseToArrayEPKcRN4Json5ValueE"));
    return ShouldFailPlatform("QUIB::WebAPIUtil::ParseToArray") ? -1 : real(value, array);
}

int QUIB::WebCGI::Init(int bodyFd, int outFd) {
    static const auto real =
        reinterpret_cast<int (*)(QUIB::WebCGI *, int, int)>(seam::Next("_ZN4QUIB6WebCGI4InitEii"));
    return ShouldFailPlatform("QUIB::WebCGI::Init") ? -1 : real(this, bodyFd, outFd);
}

int QUIB::WebCGI::AddCookieToHeader(const char *path, const char *name, const char *value) {
    static const auto real =
        reinterpret_cast<int (*)(QUIB::WebCGI *, const char *, const char *, const char *)>(
            seam::Next("_ZN4QUIB6WebCGI17AddCookieToHeaderEPKcS2_S2_"));
    return ShouldFailPlatform("QUIB::WebCGI::AddCookieToHeader") ? -1 : real(this, path, name, value);
}

int QUIB::WebCGI::WriteHeader(const char *contentType) {
    static const auto real = reinterpret_cast<int (*)(QUIB::WebCGI *, const char *)>(
        seam::Next("_ZN4QUIB6WebCGI11WriteHeaderEPKc"));
    return ShouldFailPlatform("QUIB::WebCGI::WriteHeader") ? -1 : real(this, contentType);
}

std::string WebUtils::getMountType(const std::string &path) {
    static const auto real = reinterpret_cast<std::string (*)(const std::string &)>(
        seam::Next("_ZN8WebUtils12getMountTypeERKNSt7__cxx1112basic_stringIcSt11char_traitsIcESaIcEEE"));
    return ShouldFailPlatform("WebUtils::getMountType") ? std::string() : real(path);
}

SDK::Share *SDK::Share::LoadShare(const char *name) {
    static const auto real =
        reinterpret_cast<Share *(*)(const char *)>(seam::Next("_ZN3SDK5Share9LoadShareEPKc"));
    if (ShouldFailPlatform("SDK::Share::LoadShare")) {
        return nullptr;
    }
    Share *share = real(name);
    seam::Track(share, "SDK::Share::LoadShare");
    return share;
}

void SDK::Share::Release(Share *share) {
    static const auto real = reinterpret_cast<void (*)(Share *)>(seam::Next("_ZN3SDK5Share7ReleaseEPS0_"));
    seam::Untrack(share);
    real(share);
}
