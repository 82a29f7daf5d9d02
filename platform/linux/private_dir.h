// Private database directories. SQLite trusts whatever it finds beside a database (a hot
// rollback journal is rolled in by the next writer), so a database of ours may only live in a
// directory nobody but root can write, and only files root made there are used.
#pragma once
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

}  // namespace norvo::platform
