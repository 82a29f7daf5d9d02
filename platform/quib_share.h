// Shared folders, read from QUIB_SHARE_CONF (format in platform/README.md).
#pragma once
#include "platform_export.h"
#include "vlibc_szlist.h"

// Share status flags.
enum {
    SHARE_STATUS_HIDDEN = 0x1,     // "browseable = no": kept out of share lists
    SHARE_STATUS_ENCRYPTED = 0x2,  // "encrypted = yes"
};

// Share restriction flags (reported to non-administrators only).
enum {
    SHARE_RESTRICT_NO_BROWSE = 0x1,    // "disable browsing = yes": no listing, no download
    SHARE_RESTRICT_NO_MODIFY = 0x2,    // "disable modify = yes"
    SHARE_RESTRICT_NO_DOWNLOAD = 0x4,  // "disable download = yes"
};

// Every string is non-null ("" when unset). Lists are entries joined by ',' without spaces; an
// entry holding a separator keeps its double quotes ("@CORP\domain users").
typedef struct _tag_QUIBSHARE_ {
    char *szName;
    char *szPath;  // the share's real path, e.g. /volume1/photo
    char *szComment;
    char *szNoAccessList;  // comma-separated users and @groups
    char *szRWList;
    char *szROList;
    unsigned int fStatus;    // SHARE_STATUS_*
    unsigned int fRestrict;  // SHARE_RESTRICT_*
    int ftpPrivilege;        // 0 none (the default), 1 read-only, 2 read-write
    int blAclMode;           // 1 when the share uses ACL permissions (the default)
} QUIBSHARE, *PQUIBSHARE;

typedef struct _tag_QUIBSHARE_DB_ QUIBSHARE_DB, *PQUIBSHARE_DB;

QUIB_BEGIN_C

// Looks the share up by name (case-insensitive, as SMB share names are). A name starting with
// "/" is a path: the share whose path holds it (the deepest, by whole components, after lexical
// normalisation; links are not followed), else the share named by its first component.
// 0 and *pshare set (free with QUIBShareFree); -1 with 0x1400 when there is no such share
// (also for a name no share can carry: invalid UTF-8, a name over 256 or a path over 4096
// bytes), 0x0900 when the configuration can't be read, 0x0D00 for a null or empty name.
QUIB_API int QUIBShareGet(const char *name, PQUIBSHARE *pshare);
QUIB_API void QUIBShareFree(PQUIBSHARE share);

// A cursor over every share in file order. Open returns null on failure (error set).
QUIB_API PQUIBSHARE_DB QUIBShareDBOpen(void);
// 0 with *pshare refilled (the previous record passed in is freed or reused), 1 at the end,
// -1 on failure (*pshare then untouched). Start with *pshare == NULL; free the last record with
// QUIBShareFree. The cursor walks a snapshot taken by Open.
QUIB_API int QUIBShareDBCursorGet(PQUIBSHARE_DB db, PQUIBSHARE *pshare);
QUIB_API void QUIBShareDBClose(PQUIBSHARE_DB db);

// 1 when realPath is a share's recycle bin: the folder "#recycle" directly in a share's folder,
// or, when there is a "homes" share, directly in a home folder (a folder directly under the home
// service's homes root). The path is compared lexically after normalisation (a trailing "/" is
// fine; nothing is examined on disk); a path inside a bin, a "#recycle" deeper in a share, and a
// relative path are 0. -1 with 0x0D00 for a null or empty path, 0xC300 for one of 4096 bytes or
// more, 0x0900 when the shares file (or, for a home folder, the settings) can't be read.
QUIB_API int QUIBShareIsShareRecycle(const char *realPath);

// 1 when user is named in list (entries separated by commas or white space, double quotes around
// an entry that holds them; names compare ignoring ASCII case; "@group" entries match members of
// that group, primary or supplementary, through NSS), 0 when not (also for an unknown user or
// group), -1 on bad argument (0x0D00) or when NSS failed and no other entry matched (0x8100,
// or 0x0300 when NSS was refused access).
QUIB_API int BlSDKUserIsInList(const char *user, const char *list);

QUIB_END_C
