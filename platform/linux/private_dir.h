// Private database directories. SQLite trusts whatever it finds beside a database (a hot
// rollback journal is rolled in by the next writer), so a database of ours may only live in a
// directory nobody but root can write, and only files root made there are used.
#pragma once
#include <sys/types.h>

#include <string>

#include "locked_file.h"

namespace norvo::platform {

// Opens the absolute directory path, creating its last component root:root 0700 when create
// is set and it is missing. Every component from "/" down is opened without following links
// and must be a directory owned by root and writable by neither group nor others.
// 0 and *dir; QUIB_ERR_NO_SUCH_FILE when missing (and not created); QUIB_ERR_ACCESS_DENIED
// when a component is a link, not a directory, not root's or writable by others, or when the
// caller is not root; another platform code on failure.
[[nodiscard]] int OpenPrivateDir(const std::string &path, bool create, FileDescriptor *dir);

// Checks the database name in dir, creating it (0600) when create is set and it is missing,
// and its SQLite companions ("-journal", "-wal"): each that exists must be a regular file of
// root's that group and others can't reach. 0; QUIB_ERR_NO_SUCH_FILE when the database is
// missing (and not created); QUIB_ERR_ACCESS_DENIED for a file of the wrong type, owner or
// mode; another platform code on failure.
[[nodiscard]] int CheckPrivateDatabase(int dir, const std::string &name, bool create);

// The same walk for a directory that everyone may pass through but only root may change (the
// parent of per-user directories): any caller may open it; made root:root 0711 when create is
// set (by root only; the mode is set exactly, whatever the umask).
[[nodiscard]] int OpenPassageDir(const std::string &path, bool create, FileDescriptor *dir);

// The directory name (one component) in parent that belongs to uid alone: a directory, not a
// link, owned by uid with no group or other bits. When create is set and it is missing, root
// makes it uid:gid 0700; another caller gets QUIB_ERR_NO_SUCH_FILE. Callers other than root and
// uid get QUIB_ERR_ACCESS_DENIED. Codes as OpenPrivateDir.
[[nodiscard]] int OpenOwnerDir(int parent, const std::string &name, uid_t uid, gid_t gid, bool create,
                               FileDescriptor *dir);

// CheckPrivateDatabase for a database of uid's in a directory of OpenOwnerDir: the database and
// its companions are uid's (SQLite run by root hands the journal it makes to the database's
// owner); root makes the database uid:gid 0600 when create is set. Files with a second name
// are refused by both checks.
[[nodiscard]] int CheckOwnerDatabase(int dir, const std::string &name, uid_t uid, gid_t gid, bool create);

}  // namespace norvo::platform
