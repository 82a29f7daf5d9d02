// SQLite plumbing of the login records.
#include "login_db.h"

#include "quib_paths.h"
#include "sqlite_db.h"
#include "vlibc_err.h"

namespace norvo::platform {
namespace {

constexpr char kSchema[] =
    "CREATE TABLE IF NOT EXISTS login_session("
    "sid TEXT PRIMARY KEY NOT NULL, user TEXT NOT NULL, remote_addr TEXT NOT NULL, "
    "created INTEGER NOT NULL, last_active INTEGER NOT NULL, expires INTEGER NOT NULL);"
    "CREATE INDEX IF NOT EXISTS login_session_expires ON login_session(expires);";

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
    return OpenPrivateSqlite(QUIB_LOGIN_DIR, QUIB_LOGIN_DB_NAME, create, kSchema, db);
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
