// SQLite plumbing shared by the databases of the platform (login records, failed logins, task
// records): owning handles, the one translation of result codes, the write transaction, and the
// opening of a database in a private directory (see private_dir.h for why).
#pragma once
#include <sqlite3.h>

#include <memory>
#include <string>

namespace norvo::platform {

struct SqliteCloser {
    void operator()(sqlite3 *db) const { sqlite3_close_v2(db); }
};
using SqliteDb = std::unique_ptr<sqlite3, SqliteCloser>;

struct StatementFinalizer {
    void operator()(sqlite3_stmt *statement) const { sqlite3_finalize(statement); }
};
using Statement = std::unique_ptr<sqlite3_stmt, StatementFinalizer>;

// Writers wait this long for another process's lock before giving up (SQLITE_BUSY).
inline constexpr int kBusyTimeoutMs = 5000;

// The one translation of SQLite result codes into platform codes.
[[nodiscard]] int CodeOfSqlite(int rc);

// Opens the database at path read-write, links refused, with the busy timeout, and runs schema;
// a null schema opens it read-only for readers that only ask. 0 and *db, or a platform code
// (*db may hold the failed handle; it closes itself).
[[nodiscard]] int OpenSqlite(const std::string &path, const char *schema, SqliteDb *db);

[[nodiscard]] int Prepare(sqlite3 *db, const char *sql, Statement *out);
[[nodiscard]] int BindText(sqlite3_stmt *statement, int index, const std::string &text);
// Runs a statement that returns no rows.
[[nodiscard]] int RunToEnd(sqlite3_stmt *statement);
[[nodiscard]] int Exec(sqlite3 *db, const char *sql);

// A write transaction that rolls back unless committed.
class Transaction {
public:
    explicit Transaction(sqlite3 *db) : db_(db) {}
    ~Transaction();
    Transaction(const Transaction &) = delete;
    Transaction &operator=(const Transaction &) = delete;

    // IMMEDIATE: take the write lock before reading, so what is read stays true until commit.
    [[nodiscard]] int Begin();
    [[nodiscard]] int Commit();
    [[nodiscard]] bool IsOpen() const { return open_; }

private:
    sqlite3 *db_;
    bool open_ = false;
};

// Opens dir/name (made 0600 by us, so whatever the umask) after checking the directory and the
// files beside it (private_dir.h), creating them when create is set, and runs schema, as
// OpenSqlite. 0 and *db; the codes of OpenPrivateDir and CheckPrivateDatabase, or SQLite's
// translated.
[[nodiscard]] int OpenPrivateSqlite(const char *dir, const char *name, bool create, const char *schema,
                                    SqliteDb *db);

}  // namespace norvo::platform
