#include "sqlite_db.h"

#include "locked_file.h"
#include "private_dir.h"
#include "vlibc_err.h"

namespace norvo::platform {

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

int OpenSqlite(const std::string &path, const char *schema, SqliteDb *db) {
    sqlite3 *raw = nullptr;
    const int mode = schema != nullptr ? SQLITE_OPEN_READWRITE : SQLITE_OPEN_READONLY;
    const int rc = sqlite3_open_v2(path.c_str(), &raw, mode | SQLITE_OPEN_NOFOLLOW, nullptr);
    db->reset(raw);
    if (rc != SQLITE_OK) {
        return CodeOfSqlite(rc);
    }
    sqlite3_busy_timeout(raw, kBusyTimeoutMs);
    return schema != nullptr ? Exec(raw, schema) : QUIB_ERR_NONE;
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

int RunToEnd(sqlite3_stmt *statement) {
    const int rc = sqlite3_step(statement);
    return rc == SQLITE_DONE ? QUIB_ERR_NONE : CodeOfSqlite(rc);
}

int Exec(sqlite3 *db, const char *sql) {
    return CodeOfSqlite(sqlite3_exec(db, sql, nullptr, nullptr, nullptr));
}

Transaction::~Transaction() {
    if (open_) {
        sqlite3_exec(db_, "ROLLBACK", nullptr, nullptr, nullptr);
    }
}

int Transaction::Begin() {
    const int code = Exec(db_, "BEGIN IMMEDIATE");
    open_ = code == QUIB_ERR_NONE;
    return code;
}

int Transaction::Commit() {
    const int code = Exec(db_, "COMMIT");
    open_ = code != QUIB_ERR_NONE;
    return code;
}

int OpenPrivateSqlite(const char *dir, const char *name, bool create, const char *schema, SqliteDb *db) {
    FileDescriptor dirFd;
    int code = OpenPrivateDir(dir, create, &dirFd);
    if (code == QUIB_ERR_NONE) {
        code = CheckPrivateDatabase(dirFd.Get(), name, create);
    }
    if (code != QUIB_ERR_NONE) {
        return code;
    }
    return OpenSqlite(std::string(dir) + "/" + name, schema, db);
}

}  // namespace norvo::platform
