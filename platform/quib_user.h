// Users and groups through NSS (so winbind and sssd accounts count), the administrators
// group, account expiry from shadow, the home service, and application privileges.
#pragma once
#include <sys/types.h>
#include "platform_export.h"
#include "vlibc_szlist.h"

// Account kinds, told by the name: "DOMAIN\user" is a domain account, "user@realm" a
// directory (LDAP) account, anything else local.
typedef enum _tag_AUTH_TYPE_ {
    AUTH_LOCAL = 1,
    AUTH_DOMAIN = 2,
    AUTH_LDAP = 4,
    AUTH_ALL = 7,
} AUTH_TYPE;

typedef struct _tag_QUIBUSER_ {
    char *szName;
    uid_t nUID;
    gid_t nGID;  // primary group
    char *szGecos;
    char *szHome;  // home directory as NSS gives it
    char *szShell;
    AUTH_TYPE authType;
} QUIBUSER, *PQUIBUSER;

typedef struct _tag_QUIBGROUP_ {
    char *szName;
    gid_t nGID;
    PSZLIST pMembers;  // explicit members (not users whose primary group this is)
} QUIBGROUP, *PQUIBGROUP;

// Cursors over the whole user and group databases (see QUIBUserDBOpen).
typedef struct _tag_QUIBUSER_DB_ QUIBUSER_DB, *PQUIBUSER_DB;
typedef struct _tag_QUIBGROUP_DB_ QUIBGROUP_DB, *PQUIBGROUP_DB;

QUIB_BEGIN_C

// The kind of account a name denotes (AUTH_LOCAL, AUTH_DOMAIN or AUTH_LDAP); a backslash wins
// over "@". AUTH_LOCAL with 0x0D00 for null.
QUIB_API AUTH_TYPE QUIBUserAuthTypeOf(const char *name);

// 0 and *puser (free with QUIBUserFree); -1 with 0x1D00 when unknown, 0x0D00 on bad argument
// (null, empty, over 256 bytes, control characters, invalid UTF-8), 0x8100 when NSS fails
// (0x0300 when it was refused access, e.g. to shadow).
// Nothing is cached, so blNoCache changes nothing.
QUIB_API int QUIBUserGet(const char *name, PQUIBUSER *puser);
QUIB_API int QUIBUserGetByUID(uid_t uid, PQUIBUSER *puser, int blNoCache);
QUIB_API void QUIBUserFree(PQUIBUSER user);
// 0 with the ids (either pointer may be null, not both); -1 with 0x1D00 when the user is unknown.
QUIB_API int QUIBUserGetUGID(const char *name, uid_t *uid, gid_t *gid);
// 1 expired (today, in days since 1970, is at or past shadow's expiry day; day 0 counts), 0 not
// (or no shadow entry, as for domain accounts), -1 on failure: 0x1D00 unknown user, 0x0300 when
// shadow can't be read (callers other than root).
QUIB_API int QUIBUserIsExpired(const char *name);

// Group lookups, as the user lookups: -1 with 0x1E00 when unknown.
QUIB_API int QUIBGroupGet(const char *name, PQUIBGROUP *pgroup);
QUIB_API int QUIBGroupGetByGID(gid_t gid, PQUIBGROUP *pgroup, int blNoCache);
QUIB_API int QUIBGroupGetGID(const char *name, gid_t *gid);
QUIB_API void QUIBGroupFree(PQUIBGROUP group);
// 1 when user belongs to group (primary or supplementary, via getgrouplist), 0 not, -1 failure
// (0x1D00 unknown user, 0x1E00 unknown group).
QUIB_API int QUIBGroupIsMember(const char *group, const char *user);

// Every group id of user, its primary group first, as decimal text appended to *plist (which
// may move as it grows). flags is reserved: it must be 0. 0 on success; -1 with 0x0D00 for a bad
// user (as for names), a null plist or *plist, or other flags; 0x1D00 when the user is unknown;
// 0x8100 when NSS fails; 0x2B00 when out of memory (then some ids may have been appended).
QUIB_API int QUIBGroupInfoGetgroupList(const char *user, PSZLIST *plist, int flags);

// A cursor over every account NSS enumerates (getpwent), local, domain and directory alike
// (winbind and sssd list theirs only when their enumeration is switched on). Open takes a
// snapshot of the whole database; null on failure with 0x8100 (NSS failed, or a record would
// not fit in 16 MiB) or 0x2B00. Close with QUIBUserDBClose (null is ignored).
QUIB_API PQUIBUSER_DB QUIBUserDBOpen(void);
// The next account of the snapshot whose kind (QUIBUserAuthTypeOf of its name) is one of the
// bits of type: 0 with *puser refilled (the record passed in is freed; start with null), 1 at
// the end (the last record stays the caller's, to free with QUIBUserFree), -1 on failure with
// *puser untouched: 0x0D00 for a null db or puser or a type with none of the three bits,
// 0x2B00 out of memory. Nothing is cached between snapshots, so blNoCache changes nothing.
QUIB_API int QUIBUserDBGetByCursor(PQUIBUSER_DB db, PQUIBUSER *puser, AUTH_TYPE type, int blNoCache);
QUIB_API void QUIBUserDBClose(PQUIBUSER_DB db);

// The same over every group NSS enumerates (getgrent); a group's kind is told by its name as an
// account's is ("CORP\domain users" is a domain group). Records as from QUIBGroupGet.
QUIB_API PQUIBGROUP_DB QUIBGroupDBOpen(void);
QUIB_API int QUIBGroupDBGetByCursor(PQUIBGROUP_DB db, PQUIBGROUP *pgroup, AUTH_TYPE type, int blNoCache);
QUIB_API void QUIBGroupDBClose(PQUIBGROUP_DB db);

// 1 when user is a member of the administrators group, 0 not, -1 failure (0x1D00 when the
// user is unknown). Domain and directory accounts count (as the Ex call with blWithDomain 1).
QUIB_API int QUIBGroupIsAdminGroupMem(const char *user);
// As above; with blWithDomain 0 only local accounts can be administrators (others are 0 without
// a lookup), with 1 domain and directory accounts count too.
QUIB_API int QUIBGroupIsAdminGroupMemEx(const char *user, int blWithDomain);

// 1 when the home service is on for this user's kind of account and the user's home lies below
// the homes root (whole components), 0 when not (0x0D00 for a null user). The kind is the
// record's authType, or told by szName when authType is not one of the three.
QUIB_API int QUIBServiceUserHomeIsEnabled(const PQUIBUSER user);
// The home folder of user into buf (size bytes), normalised: "/volume1/homes/alice". 0 when
// user has one: the home service is on for the account's kind and its home lies below the
// homes root (QUIBServiceUserHomeIsEnabled). The folder itself is not created nor required to
// exist. -1 otherwise, with 0xBE00 when the service is off for the account or its home lies
// elsewhere, 0x0900 when the settings can't be read, QUIBUserGet's codes (0x1D00 unknown user),
// 0xC300 when buf is too small, 0x0D00 for a null user or buf or a size below 1.
QUIB_API int QUIBServiceHomePathGet(const char *user, char *buf, int size);

// 1 when user holds the application privilege priv (see platform/README.md), 0 when not: also
// for unknown users, a missing file, and on failure (the error slot then says why).
QUIB_API int VLIBUserPrivilegeHas(const char *user, const char *priv);

// A character of the crypt salt alphabet ("./0-9A-Za-z") made from num and bits of the kernel's
// random source, so that a salt made from a guessable number (the uptime) is not guessable.
// '\0' with 0x8100 when the random source fails: a salt with it makes crypt fail.
QUIB_API char QUIBUserRandomNumMap2Seed(long num);

QUIB_END_C
