// The login records of the web interface, kept in SQLite at QUIB_LOGIN_DB:
//
//   CREATE TABLE login_session(sid TEXT PRIMARY KEY, user TEXT NOT NULL,
//       remote_addr TEXT NOT NULL, created INTEGER NOT NULL,
//       last_active INTEGER NOT NULL, expires INTEGER NOT NULL)
//
// Times are seconds since the epoch. Each call opens the database and closes it again: CGI
// processes live for one request.
#pragma once
#include <time.h>

#include <string>

#include "sqlite_db.h"

namespace norvo::platform {

using LoginDb = SqliteDb;

struct LoginRecord {
    std::string sid;
    std::string user;
    std::string remoteAddr;
    time_t created = 0;
    time_t expires = 0;
};

// Opens the database, creating it and its directory (root's, 0600 and 0700) when create is set.
// 0 and *db; QUIB_ERR_NO_SUCH_FILE when it does not exist and create is not set;
// QUIB_ERR_ACCESS_DENIED when the caller is not root or the directory, the database or a
// journal beside it is not root's own (see private_dir.h); another platform code on failure.
[[nodiscard]] int OpenLoginDb(bool create, LoginDb *db);

// Drops expired records and adds record. 0 or a platform code.
[[nodiscard]] int InsertLogin(sqlite3 *db, const LoginRecord &record, time_t now);

// Drops expired records, then finds sid and moves its expiry to now + lifetime.
// 0 and *user; QUIB_ERR_ACCESS_DENIED when there is no live record; another code on failure.
[[nodiscard]] int TouchLogin(sqlite3 *db, const std::string &sid, time_t now, time_t lifetime,
                             std::string *user);

// 0 when sid's record was removed, QUIB_ERR_ACCESS_DENIED when there was none, else a code.
[[nodiscard]] int DeleteLogin(sqlite3 *db, const std::string &sid);

}  // namespace norvo::platform
