// SQLite plumbing of the login records.
#include "login_db.h"

#include "locked_file.h"
#include "private_dir.h"
#include "quib_paths.h"
#include "vlibc_err.h"

namespace norvo::platform {
namespace {

constexpr int kBusyTimeoutMs = 5000;

constexpr char kSchema[] =
    "CREATE TABLE IF NOT EXISTS login_session("
    "sid TEXT PRIMARY KEY NOT NULL, user TEXT NOT NULL, remote_addr TEXT NOT NULL, "
    "created INTEGER NOT NULL, last_active INTEGER NOT NULL, expires INTEGER NOT NULL);"
    "CREATE INDEX IF NOT EXISTS login_session_expires ON login_session(expires);";

struct StatementFinalizer {
    void operator()(sqlite3_stmt *statement) const { sqlite3_finalize(statement); }
};
using Statement = std::unique_ptr<sqlite3_stmt, StatementFinalizer>;

// The one translation of SQLite result codes into platform codes.
int CodeOfSqlite(int rc) {
    switch (rc & 0xFF) {
        case SQLITE_OK:
        case SQLITE_DONE:
        case SQLITE_ROW:
            return QUIB_ERR_NONE;
        case SQLITE_NOMEM:
            return QUIB_ERR_NO_MEMORY;
        case SQLITE_FULL:
            return QUIB_ERR_NO_SPACE;
        case SQLITE_READONLY:
            return QUIB_ERR_READ_ONLY_FS;
        case SQLITE_PERM:
        case SQLITE_AUTH:
            return QUIB_ERR_ACCESS_DENIED;
        default:
            return QUIB_ERR_FAILED;
    }
}

int Prepare(sqlite3 *db, const char *sql, Statement *out) {
    sqlite3_stmt *raw = nullptr;
    const int rc = sqlite3_prepare_v2(db, sql, -1, &raw, nullptr);
    out->reset(raw);
    return CodeOfSqlite(rc);
}

int BindText(sqlite3_stmt *statement, int index, const std::string &text) {
    return CodeOfSqlite(
        sqlite3_bind_text(statement, index, text.c_str(), static_cast<int>(text.size()), SQLITE_TRANSIENT));
}

// Runs a statement that returns no rows.
int RunToEnd(sqlite3_stmt *statement) {
    const int rc = sqlite3_step(statement);
    return rc == SQLITE_DONE ? QUIB_ERR_NONE : CodeOfSqlite(rc);
}

int Exec(sqlite3 *db, const char *sql) {
    return CodeOfSqlite(sqlite3_exec(db, sql, nullptr, nullptr, nullptr));
}

// A write transaction that rolls back unless committed.
class Transaction {
public:
    explicit Transaction(sqlite3 *db) : db_(db) {}
    ~Transaction() {
        if (open_) {
            sqlite3_exec(db_, "ROLLBACK", nullptr, nullptr, nullptr);
        }
    }
    Transaction(const Transaction &) = delete;
    Transaction &operator=(const Transaction &) = delete;

    // IMMEDIATE: take the write lock before reading, so a refresh never races a purge.
    int Begin() {
        const int code = Exec(db_, "BEGIN IMMEDIATE");
        open_ = code == QUIB_ERR_NONE;
        return code;
    }
    int Commit() {
        const int code = Exec(db_, "COMMIT");
        open_ = code != QUIB_ERR_NONE;
        return code;
    }

private:
    sqlite3 *db_;
    bool open_ = false;
};

int PurgeExpired(sqlite3 *db, time_t now) {
    Statement purge;
    if (const int code = Prepare(db, "DELETE FROM login_session WHERE expires <= ?1", &purge)) {
        return code;
    }
    sqlite3_bind_int64(purge.get(), 1, now);
    return RunToEnd(purge.get());
}

}  // namespace

int OpenLoginDb(bool create, LoginDb *db) {
    // The database is made here rather than by SQLite so that it is born 0600 whatever the
    // umask; see private_dir.h for why its directory is checked every time.
    FileDescriptor dir;
    int code = OpenPrivateDir(QUIB_LOGIN_DIR, create, &dir);
    if (code == QUIB_ERR_NONE) {
        code = CheckPrivateDatabase(dir.Get(), QUIB_LOGIN_DB_NAME, create);
    }
    if (code != QUIB_ERR_NONE) {
        return code;
    }
    sqlite3 *raw = nullptr;
    const int rc =
        sqlite3_open_v2(QUIB_LOGIN_DB, &raw, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOFOLLOW, nullptr);
    db->reset(raw);
    if (rc != SQLITE_OK) {
        return CodeOfSqlite(rc);
    }
    sqlite3_busy_timeout(raw, kBusyTimeoutMs);
    return Exec(raw, kSchema);
}

int InsertLogin(sqlite3 *db, const LoginRecord &record, time_t now) {
    Transaction transaction(db);
    if (const int code = transaction.Begin()) {
        return code;
    }
    if (const int code = PurgeExpired(db, now)) {
        return code;
    }
    Statement insert;
    if (const int code = Prepare(db,
                                 "INSERT INTO login_session(sid, user, remote_addr, created, "
                                 "last_active, expires) VALUES(?1, ?2, ?3, ?4, ?4, ?5)",
                                 &insert)) {
        return code;
    }
    int code = BindText(insert.get(), 1, record.sid);
    if (code == QUIB_ERR_NONE) {
        code = BindText(insert.get(), 2, record.user);
    }
    if (code == QUIB_ERR_NONE) {
        code = BindText(insert.get(), 3, record.remoteAddr);
    }
    if (code != QUIB_ERR_NONE) {
        return code;
    }
    sqlite3_bind_int64(insert.get(), 4, record.created);
    sqlite3_bind_int64(insert.get(), 5, record.expires);
    if (const int stepCode = RunToEnd(insert.get())) {
        return stepCode;
    }
    return transaction.Commit();
}

int TouchLogin(sqlite3 *db, const std::string &sid, time_t now, time_t lifetime, std::string *user) {
    Transaction transaction(db);
    if (const int code = transaction.Begin()) {
        return code;
    }
    if (const int code = PurgeExpired(db, now)) {
        return code;
    }
    Statement touch;
    if (const int code = Prepare(db,
                                 "UPDATE login_session SET last_active = ?2, expires = ?3 "
                                 "WHERE sid = ?1 RETURNING user",
                                 &touch)) {
        return code;
    }
    if (const int code = BindText(touch.get(), 1, sid)) {
        return code;
    }
    sqlite3_bind_int64(touch.get(), 2, now);
    sqlite3_bind_int64(touch.get(), 3, now + lifetime);
    const int rc = sqlite3_step(touch.get());
    if (rc == SQLITE_DONE) {
        touch.reset();
        const int code = transaction.Commit();  // the purge stands even when sid is unknown
        return code != QUIB_ERR_NONE ? code : QUIB_ERR_ACCESS_DENIED;
    }
    if (rc != SQLITE_ROW) {
        return CodeOfSqlite(rc);
    }
    const unsigned char *name = sqlite3_column_text(touch.get(), 0);
    if (name == nullptr) {
        return QUIB_ERR_FAILED;
    }
    user->assign(reinterpret_cast<const char *>(name),
                 static_cast<size_t>(sqlite3_column_bytes(touch.get(), 0)));
    if (const int code = RunToEnd(touch.get())) {
        return code;
    }
    touch.reset();
    return transaction.Commit();
}

int DeleteLogin(sqlite3 *db, const std::string &sid) {
    Statement remove;
    if (const int code = Prepare(db, "DELETE FROM login_session WHERE sid = ?1", &remove)) {
        return code;
    }
    if (const int code = BindText(remove.get(), 1, sid)) {
        return code;
    }
    if (const int code = RunToEnd(remove.get())) {
        return code;
    }
    return sqlite3_changes(db) > 0 ? QUIB_ERR_NONE : QUIB_ERR_ACCESS_DENIED;
}

}  // namespace norvo::platform
