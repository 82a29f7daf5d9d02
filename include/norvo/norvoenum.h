// Enumeration support of the listings: the per-process mount-status table, the user and group
// name caches, and whole-database enumerations of users, groups and a user's groups.
//
// Ownership: an NvoEnum owns its mount-status table and its name caches for its lifetime;
// nothing is shared between objects or kept after them. Maps and lists passed in belong to the
// caller, who may pass them non-empty: the calls only add or overwrite entries.
#pragma once
#include <list>
#include <map>
#include <string>

#include "norvo/export.h"
#include "quib_user.h"

// The state of one mount as the mount table gives it.
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

    // The name caches, which live as long as this object.
    NorvoUserEnum &UserEnum() { return userEnum_; }

private:
    NorvoUserEnum userEnum_;
};
