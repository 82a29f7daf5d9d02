// Enumeration support of the listings: the per-process mount-status table, the user and group
// name caches, and whole-database enumerations of users, groups and a user's groups.
//
// Ownership: an NvoEnum owns its mount-status table and its name caches for its lifetime;
// nothing is shared between objects or kept after them. Maps and lists passed in belong to the
// caller, who may pass them non-empty: the calls only add or overwrite entries.
#pragma once
#include <stdint.h>

#include <list>
#include <map>
#include <string>
#include <vector>

#include <json/value.h>

#include "norvo/export.h"
#include "quib_user.h"

// The state of one mount as the mount table gives it.
namespace FileSearch {
class FindComp;
}

// Which groups of DIRENTRY_INFO fields a listing fills, and DumpFileInfo prints.
enum {
    NVO_INFO_REAL_PATH = 0x01,
    NVO_INFO_SIZE = 0x02,
    NVO_INFO_OWNER = 0x04,
    NVO_INFO_TIME = 0x08,
    NVO_INFO_PERM = 0x10,
    NVO_INFO_TYPE = 0x20,
    NVO_INFO_MOUNT_POINT_TYPE = 0x40,
    NVO_INFO_VOLUME_STATUS = 0x80,
    NVO_INFO_SYNC_SHARE = 0x100,  // share listing only
};

// Which entries a listing keeps (any other value keeps both). The fixed underlying type makes
// every int a valid value, so "any other value" is defined behaviour.
typedef enum _tag_dir_entry_type_ : int {
    DIR_ENTRY_TYPE_DIR = 0,
    DIR_ENTRY_TYPE_FILE = 1,
    DIR_ENTRY_TYPE_ALL = 2,
} DIR_ENTRY_TYPE;

// One listed entry. A fresh record has empty strings, zero numbers, false flags and the share
// privilege 4; the info flags say which fields a listing filled.
struct DIRENTRY_INFO {
    std::string name;
    std::string path;            // user-visible: /share/folders/name
    std::string real_path;       // NVO_INFO_REAL_PATH
    std::string type;            // NVO_INFO_TYPE: lower-case extension, "" for folders
    uint64_t size = 0;           // NVO_INFO_SIZE
    uint32_t mode = 0;           // NVO_INFO_PERM: the stat mode word
    uint32_t acl_privilege = 0;  // NVO_INFO_PERM: the ACL permission mask of the caller
    bool is_acl_mode = false;    // NVO_INFO_PERM
    int32_t mtime = 0;           // NVO_INFO_TIME, seconds
    int32_t ctime = 0;
    int32_t crtime = 0;
    int32_t atime = 0;
    uint32_t uid = 0;  // NVO_INFO_OWNER
    std::string user;
    uint32_t gid = 0;
    std::string group;
    bool isdir = false;
    std::string mount_point_type;  // NVO_INFO_MOUNT_POINT_TYPE: "", "iso", "remote", "remotefail"
    // Filled by the share listing only.
    int32_t share_privilege = 4;
    int32_t ftp_privilege = 0;
    bool acl_enabled = false;
    bool synced_share = false;
    uint64_t freespace = 0;
    uint64_t totalspace = 0;
    bool readonly = false;
    std::string extra;  // carried with the record; no listing sets it
};

// The order of a listing: directories first, then the key, then the case-insensitive name.
// Keys: "size", "mtime", "crtime", "ctime", "atime", "user" (by uid), "group" (by gid), "posix",
// "type"; any other key sorts by name alone.
class NORVO_API EnumCompare {
public:
    explicit EnumCompare(std::string key);
    // true when a comes before b.
    bool operator()(const DIRENTRY_INFO &a, const DIRENTRY_INFO &b) const;

private:
    std::string key_;
    int rule_;  // the key, decoded once
};

NORVO_BEGIN_C
// Fills json with the entry as the web interface receives it: "name", "path", "isdir", and
// under "additional" the groups the info flags ask for.
NORVO_API void DumpFileInfo(int info, const DIRENTRY_INFO &entry, Json::Value &json);
NORVO_END_C

struct MOUNT_STATUS {
    // Index into the platform's rgszFsType of the mount-table type name; 11 (FSTYPE_UNKNOWN)
    // when it equals none of the table's names.
    int fsType = 0;
    bool readOnly = false;
};

// One account as the name cache and the user enumeration keep it.
typedef struct _tag_USER_INFO_ {
    std::string name;
    unsigned int uid = 0;
    unsigned int gid = 0;  // the primary group
} USER_INFO;

typedef struct _tag_GROUP_INFO_ {
    std::string name;
    unsigned int gid = 0;
} GROUP_INFO;

// The mount table of this process, read from /proc/mounts at most once per object (again only
// after a failed read), keyed by mount directory in byte order.
class NORVO_API NorvoMountStatus {
public:
    // Reads the mount table into the object. 1 on success; 0 when /proc/mounts can't be opened,
    // with the platform error 0x900 set (file "norvoenum.cpp", line 812) and the table still
    // unread. Of several mounts on one directory (bind or stacked mounts) the first line of the
    // table counts, also against entries from an earlier read.
    int GetMountStatus();

    // The read-only state of the deepest mount whose directory is path or a parent of it by
    // whole components (/volume1/usb holds /volume1/usb/a, not /volume1/usbx). false when no
    // mount holds path, for a null path, and when the table can't be read.
    // Intended oddity: the root mount "/" holds only "/" itself and paths starting with "//".
    bool IsReadOnly(const char *path);

    // The type index of the mount whose directory is exactly path once every trailing "/" is
    // cut (so "/" itself becomes "" and is no mount directory); no prefix search. 10
    // (FSTYPE_NOT_MOUNT_POINT) when path is no mount directory or is null, 11 when the table
    // can't be read.
    int getFSTYPE(const char *path);

    // The table as read so far (empty before the first successful read).
    const std::map<std::string, MOUNT_STATUS> &Mounts() const { return mounts_; }

private:
    std::map<std::string, MOUNT_STATUS> mounts_;
    bool loaded_ = false;
};

// Per-process caches of user and group names, filled one id at a time from the platform.
class NORVO_API NorvoUserEnum {
public:
    // The name of uid (or gid), looked up in the platform on first use; "" when the platform
    // does not know the id. Unknown ids are not cached: the next call asks again.
    std::string GetUserNameByUID(unsigned int uid);
    std::string GetGroupNameByGID(unsigned int gid);

    // Looks uid (or gid) up in the platform now, passing noCache on, and stores (or overwrites)
    // the cache entry. 1 when found, 0 when not or on failure (the cache is then unchanged).
    int UpdateUserInfoMap(unsigned int uid, bool noCache);
    int UpdateGroupInfoMap(unsigned int gid, bool noCache);

private:
    std::map<unsigned int, _tag_USER_INFO_> users_;
    std::map<unsigned int, _tag_GROUP_INFO_> groups_;
};

// The enumerations of the listings. Built on the mount-status table; holds the name caches.
class NORVO_API NvoEnum : public NorvoMountStatus {
public:
    NvoEnum();
    ~NvoEnum();
    // The tables belong to one object: copies would silently diverge.
    NvoEnum(const NvoEnum &) = delete;
    NvoEnum &operator=(const NvoEnum &) = delete;

    // Adds every account of the platform's user database whose kind type selects (AUTH_LOCAL,
    // AUTH_DOMAIN, AUTH_LDAP or a union of them; the name tells the kind), keyed by uid; an id
    // listed twice keeps the last record. 1 on success, also when the database stops early;
    // 0 when it can't be opened, logged as "norvoenum.cpp:558 Failed to open user db".
    int EnumAllUsers(std::map<unsigned int, _tag_USER_INFO_> &users, AUTH_TYPE type);
    // The same for groups, keyed by gid; "norvoenum.cpp:527 Failed to open group db".
    int EnumAllGroups(std::map<unsigned int, _tag_GROUP_INFO_> &groups, AUTH_TYPE type);

    // Appends the ids of user's groups (the primary one first) to gids. 1 on success, also for
    // a user the platform does not know (nothing appended); 0 when the platform's list can't be
    // allocated or holds an element that is null (logged with line 601) or not wholly a decimal
    // number of at most 32 bits (line 606); the ids before that element stay appended.
    int EnumUserGroups(std::list<unsigned int> &gids, std::string user);

    // Lists one directory for a user: entries not hidden and passing every condition (asked
    // with the bare name), filled as info asks (widened by the sort key), sorted by sortKey,
    // reversed unless ascending, counted into *total, then cut to the page [offset, +limit)
    // unless limit is 0. Records out held before take part in the order, the count and the page.
    // The conditions stay the caller's. realPath must be what NvoFullPathGet made of userPath:
    // the directory is opened beneath the share's (or home's) folder, and a symbolic link on the
    // way there fails with 407, as does a user path with a "." or ".." component with 400. Links
    // inside the directory are seen as links (never followed) and, like devices, not listed.
    // 1 on success; 0 with the error slot set (400, 401, 402, 407 (also for the user path "/"),
    // 408, 410). Records appended before a failure stay in out.
    int NvoLibDirEntryListEnum(const char *userPath, const char *realPath, const char *sortKey, int info,
                               unsigned long offset, unsigned long limit, bool ascending,
                               _tag_dir_entry_type_ type, std::vector<FileSearch::FindComp *> conditions,
                               std::list<DIRENTRY_INFO> &out, unsigned long *total);
    // Fills one record. dtype is the directory reader's type byte (0 unknown, 4 folder, 8 file).
    // 0 keep, 1 skip, -1 failure (error slot set except for an I/O error).
    int FillFileInfo(const char *userPath, const char *realPath, const char *name, _tag_dir_entry_type_ type,
                     unsigned char dtype, int info, DIRENTRY_INFO &entry);
    // Lists the top of the user-visible tree: the user's home, then the shares the user may see,
    // with share privileges and volume figures; sorted, ordered and paged as a directory listing.
    // context and flag are handed to the domain and directory share-list generators. 1 on
    // success; 0 with 403 (null user) or 401 (no share list).
    int NvoLibShareEntryListEnum(const char *user, const char *context, bool flag, const char *sortKey,
                                 int info, unsigned long offset, unsigned long limit, bool ascending,
                                 std::list<DIRENTRY_INFO> &out, unsigned long *total);
    // Sorts in place with EnumCompare(key); stable.
    void EntryListSort(std::list<DIRENTRY_INFO> &list, std::string key);
    // Cuts list to at most limit records from offset (a negative offset, as a signed 32-bit
    // number, walks backward around the ring). limit 0 leaves the list as it is.
    void NvoLibDirEntrySlice(std::list<DIRENTRY_INFO> &list, unsigned long offset, unsigned long limit);

    // The name caches, which live as long as this object.
    NorvoUserEnum &UserEnum() { return userEnum_; }

private:
    NorvoUserEnum userEnum_;
};
