// SQLite plumbing shared by the platform's databases (login records, failed logins): owning
// handles, the one translation of SQLite results into platform codes, and the opening of a
// database in a private directory (see private_dir.h for why).
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

// The platform code of a SQLite result (QUIB_ERR_NONE for OK, DONE and ROW).
[[nodiscard]] int CodeOfSqlite(int rc);
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

    // IMMEDIATE: take the write lock before reading, so a refresh never races a purge.
    [[nodiscard]] int Begin();
    [[nodiscard]] int Commit();

private:
    sqlite3 *db_;
    bool open_ = false;
};

// Opens dir/name (made 0600 by us, so whatever the umask) after checking the directory and the
// files beside it (private_dir.h), creating them when create is set, with a busy timeout of
// 5 s, and runs schema. 0 and *db; the codes of OpenPrivateDir and CheckPrivateDatabase, or
// SQLite's translated.
[[nodiscard]] int OpenPrivateSqlite(const char *dir, const char *name, bool create, const char *schema, SqliteDb *db);

}  // namespace norvo::platform
