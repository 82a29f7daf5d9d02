// The file index's entry points over SQLite (fileidx_sql.h does the SQL).
#include "fileidx.h"

#include <errno.h>
#include <limits.h>
#include <stdint.h>
#include <sys/stat.h>

#include <memory>
#include <string>
#include <vector>

#include "api_guard.h"
#include "fileidx_sql.h"
#include "fs_path.h"
#include "vlibc_err.h"
#include "volume_index.h"

using norvo::platform::DbOwner;
using norvo::platform::FileIdxDb;
using norvo::platform::FileIdxStatement;
using norvo::platform::Guarded;
using norvo::platform::SqlText;

struct __tag_FI_OUTPUT_DB {
    FileIdxDb db;
    FileIdxStatement insert;
    bool inTransaction = false;
    bool broken = false;
    int pending = 0;
    int batch = FILEIDX_OUTPUT_BATCH;  // rows per transaction
};

namespace {

int Fail(int code, int line) {
    VLIBCErrSetEx(code, QUIB_SOURCE_NAME, line);
    return -1;
}
#define FILEIDX_FAIL(code) Fail((code), __LINE__)

int64_t Clamp(const unsigned long long *value, int64_t absent) {
    if (value == nullptr) {
        return absent;
    }
    return *value > static_cast<unsigned long long>(INT64_MAX) ? INT64_MAX : static_cast<int64_t>(*value);
}

int Exec(sqlite3 *db, const char *sql) {
    return norvo::platform::FileIdxCodeOf(db, sqlite3_exec(db, sql, nullptr, nullptr, nullptr));
}

// Runs a statement that returns no rows.
int RunToEnd(sqlite3_stmt *statement) {
    const int rc = sqlite3_step(statement);
    return rc == SQLITE_DONE ? QUIB_ERR_NONE
                             : norvo::platform::FileIdxCodeOf(sqlite3_db_handle(statement),
                                                              rc == SQLITE_ROW ? SQLITE_ERROR : rc);
}

// A write statement on a database opened for this call.
int RunWrite(const char *dbPath, const SqlText &sql, int *changes = nullptr) {
    FileIdxDb db;
    FileIdxStatement statement;
    int code = norvo::platform::OpenFileIdxDb(dbPath, DbOwner::kCaller, &db);
    if (code == QUIB_ERR_NONE) {
        code = norvo::platform::PrepareBound(db.get(), sql, &statement);
    }
    if (code == QUIB_ERR_NONE) {
        code = RunToEnd(statement.get());
    }
    if (code == QUIB_ERR_NONE && changes != nullptr) {
        *changes = sqlite3_changes(db.get());
    }
    return code;
}

// Reads the hits whose rowids sql selects, in its order, in one read transaction so that the
// page is one snapshot.
int SelectPage(sqlite3 *db, const SqlText &sql, FILEIDX_SELECT_CB callback, void *arg) {
    if (const int code = Exec(db, "BEGIN")) {
        return code;
    }
    const norvo::platform::ScopeExit end([db] { sqlite3_exec(db, "ROLLBACK", nullptr, nullptr, nullptr); });
    std::vector<sqlite3_int64> rowids;
    {
        FileIdxStatement keys;
        if (const int code = norvo::platform::PrepareBound(db, sql, &keys)) {
            return code;
        }
        int rc;
        while ((rc = sqlite3_step(keys.get())) == SQLITE_ROW) {
            rowids.push_back(sqlite3_column_int64(keys.get(), 0));
        }
        if (rc != SQLITE_DONE) {
            return norvo::platform::FileIdxCodeOf(db, rc);
        }
    }
    SqlText one;
    one.text = std::string("SELECT ") + norvo::platform::kFileIdxColumns + " FROM fileinfo WHERE rowid = ?";
    one.values.push_back({false, 0, {}});
    FileIdxStatement read;
    if (const int code = norvo::platform::PrepareBound(db, one, &read)) {
        return code;
    }
    auto record = std::make_unique<__tag_FI_FILE_INFO_DATA>();
    for (const sqlite3_int64 rowid : rowids) {
        sqlite3_reset(read.get());
        sqlite3_bind_int64(read.get(), 1, rowid);
        const int rc = sqlite3_step(read.get());
        if (rc != SQLITE_ROW) {
            return norvo::platform::FileIdxCodeOf(db, rc == SQLITE_DONE ? SQLITE_CORRUPT : rc);
        }
        norvo::platform::ReadRecord(read.get(), record.get());
        if (callback(record.get(), arg) == 0) {
            break;
        }
    }
    return QUIB_ERR_NONE;
}

int OutputCommit(__tag_FI_OUTPUT_DB *out) {
    if (!out->inTransaction) {
        return QUIB_ERR_NONE;
    }
    const int code = Exec(out->db.get(), "COMMIT");
    if (code != QUIB_ERR_NONE) {
        Exec(out->db.get(), "ROLLBACK");
        out->broken = true;
    }
    out->inTransaction = false;
    out->pending = 0;
    return code;
}

int OutputInsert(__tag_FI_OUTPUT_DB *out, const __tag_FI_FILE_INFO_DATA &record) {
    if (out->broken) {
        return QUIB_ERR_FAILED;
    }
    if (!out->inTransaction) {
        if (const int code = Exec(out->db.get(), "BEGIN IMMEDIATE")) {
            return code;
        }
        out->inTransaction = true;
    }
    sqlite3_stmt *insert = out->insert.get();
    int code = norvo::platform::BindRecord(insert, record);
    if (code == QUIB_ERR_NONE) {
        code = RunToEnd(insert);
    }
    sqlite3_reset(insert);
    if (code != QUIB_ERR_NONE) {
        Exec(out->db.get(), "ROLLBACK");
        out->inTransaction = false;
        out->broken = true;
        return code;
    }
    return ++out->pending >= out->batch ? OutputCommit(out) : QUIB_ERR_NONE;
}

int OutputOpen(const char *dbPath, DbOwner owner, std::unique_ptr<__tag_FI_OUTPUT_DB> *out) {
    auto db = std::make_unique<__tag_FI_OUTPUT_DB>();
    if (const int code = norvo::platform::OpenFileIdxDb(dbPath, owner, &db->db)) {
        return code;
    }
    SqlText sql;
    sql.text = std::string("INSERT OR REPLACE INTO fileinfo(") + norvo::platform::kFileIdxColumns +
               ") VALUES(?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?)";
    if (const int code = norvo::platform::PrepareBound(db->db.get(), sql, &db->insert)) {
        return code;
    }
    *out = std::move(db);
    return QUIB_ERR_NONE;
}

}  // namespace

int FILEIDXDBCreate(const char *dbPath) {
    return Guarded(-1, [&] {
        const int code = norvo::platform::CreateFileIdxDb(dbPath);
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXDBInsert(const char *dbPath, const __tag_FI_FILE_INFO_DATA *records, int count) {
    return Guarded(-1, [&] {
        if (count < 0 || (records == nullptr && count > 0)) {
            return FILEIDX_FAIL(QUIB_ERR_BAD_PARAMETER);
        }
        std::unique_ptr<__tag_FI_OUTPUT_DB> out;
        int code = OutputOpen(dbPath, DbOwner::kCaller, &out);
        if (code == QUIB_ERR_NONE) {
            out->batch = INT_MAX;  // all or none
        }
        for (int i = 0; code == QUIB_ERR_NONE && i < count; ++i) {
            code = OutputInsert(out.get(), records[i]);
        }
        if (code == QUIB_ERR_NONE) {
            code = OutputCommit(out.get());
        }
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXDBSelect(const char *dbPath, const FI_QUERY *query, FILEIDX_SELECT_CB callback, void *arg,
                    const unsigned long long *limit, const unsigned long long *offset, int flags) {
    return Guarded(-1, [&] {
        if (query == nullptr || callback == nullptr || flags != 0) {
            return FILEIDX_FAIL(QUIB_ERR_BAD_PARAMETER);
        }
        // The page is found by sorting keys and rowids only, then its hits are read one by
        // one: sorting whole records of a deep page costs twice as much.
        SqlText sql;
        sql.text = "SELECT rowid FROM fileinfo WHERE ";
        int code = norvo::platform::AppendWhere(query->where, &sql);
        if (code == QUIB_ERR_NONE) {
            code = norvo::platform::AppendOrder(*query, &sql);
        }
        sql.text += " LIMIT ? OFFSET ?";
        sql.values.push_back({false, Clamp(limit, -1), {}});
        sql.values.push_back({false, Clamp(offset, 0), {}});
        FileIdxDb db;
        if (code == QUIB_ERR_NONE) {
            code = norvo::platform::OpenFileIdxDb(dbPath, DbOwner::kCaller, &db);
        }
        if (code == QUIB_ERR_NONE) {
            code = SelectPage(db.get(), sql, callback, arg);
        }
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXCountGet(const char *dbPath, const FI_QUERY *query, unsigned long long *total) {
    return Guarded(-1, [&] {
        if (query == nullptr || total == nullptr) {
            return FILEIDX_FAIL(QUIB_ERR_BAD_PARAMETER);
        }
        SqlText sql;
        sql.text = "SELECT count(*) FROM fileinfo WHERE ";
        int code = norvo::platform::AppendWhere(query->where, &sql);
        FileIdxDb db;
        FileIdxStatement statement;
        if (code == QUIB_ERR_NONE) {
            code = norvo::platform::OpenFileIdxDb(dbPath, DbOwner::kCaller, &db);
        }
        if (code == QUIB_ERR_NONE) {
            code = norvo::platform::PrepareBound(db.get(), sql, &statement);
        }
        if (code == QUIB_ERR_NONE) {
            const int rc = sqlite3_step(statement.get());
            code = rc == SQLITE_ROW
                       ? QUIB_ERR_NONE
                       : norvo::platform::FileIdxCodeOf(db.get(), rc == SQLITE_DONE ? SQLITE_ERROR : rc);
        }
        if (code != QUIB_ERR_NONE) {
            return FILEIDX_FAIL(code);
        }
        *total = static_cast<unsigned long long>(sqlite3_column_int64(statement.get(), 0));
        return 0;
    });
}

int FILEIDXDBUpdate(const char *dbPath, const __tag_FI_SQL_COND *setList, const __tag_FI_SQL_COND *where) {
    return Guarded(-1, [&] {
        SqlText sql;
        sql.text = "UPDATE fileinfo SET ";
        int code = norvo::platform::AppendSetList(setList, &sql);
        sql.text += " WHERE ";
        if (code == QUIB_ERR_NONE) {
            code = norvo::platform::AppendWhere(where, &sql);
        }
        if (code == QUIB_ERR_NONE) {
            code = RunWrite(dbPath, sql);
        }
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXDBDel(const char *dbPath, const __tag_FI_SQL_COND *where) {
    return Guarded(-1, [&] {
        SqlText sql;
        sql.text = "DELETE FROM fileinfo WHERE ";
        int code = where == nullptr ? QUIB_ERR_BAD_PARAMETER : norvo::platform::AppendWhere(where, &sql);
        if (code == QUIB_ERR_NONE) {
            code = RunWrite(dbPath, sql);
        }
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXOutputDBOpen(const char *dbPath, FI_OUTPUT_DB **out) {
    return Guarded(-1, [&] {
        if (out == nullptr) {
            return FILEIDX_FAIL(QUIB_ERR_BAD_PARAMETER);
        }
        *out = nullptr;
        std::unique_ptr<__tag_FI_OUTPUT_DB> db;
        if (const int code = OutputOpen(dbPath, DbOwner::kCaller, &db)) {
            return FILEIDX_FAIL(code);
        }
        *out = db.release();
        return 0;
    });
}

int FILEIDXOutputDBInsert(FI_OUTPUT_DB *db, const __tag_FI_FILE_INFO_DATA *record) {
    return Guarded(-1, [&] {
        if (db == nullptr || record == nullptr) {
            return FILEIDX_FAIL(QUIB_ERR_BAD_PARAMETER);
        }
        const int code = OutputInsert(db, *record);
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXOutputDBCommit(FI_OUTPUT_DB *db) {
    return Guarded(-1, [&] {
        if (db == nullptr) {
            return FILEIDX_FAIL(QUIB_ERR_BAD_PARAMETER);
        }
        const int code = db->broken ? QUIB_ERR_FAILED : OutputCommit(db);
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXOutputDBClose(FI_OUTPUT_DB *db) {
    return Guarded(-1, [&] {
        const std::unique_ptr<__tag_FI_OUTPUT_DB> owned(db);
        if (db == nullptr) {
            return 0;
        }
        const int code = db->broken ? QUIB_ERR_FAILED : OutputCommit(db);
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXIsIndexEnable(const char *volume) {
    return Guarded(-1, [&] {
        if (const int err = norvo::platform::CheckPathArgument(volume)) {
            return FILEIDX_FAIL(VLIBCErrFromErrno(err));
        }
        return norvo::platform::VolumeIndexUsable(volume) ? 1 : 0;
    });
}

int FILEIDXResultGetAndTableGen(const char *volume, const __tag_FI_SQL_COND *conditions,
                                const __tag_FI_SQL_COND *folderConditions, FILEIDX_ROW_FILTER filter,
                                const FI_TABLE_GEN_CONTEXT *context) {
    return Guarded(-1, [&] {
        if (context == nullptr || norvo::platform::CheckPathArgument(volume) != 0) {
            return FILEIDX_FAIL(QUIB_ERR_BAD_PARAMETER);
        }
        std::unique_ptr<__tag_FI_OUTPUT_DB> out;
        int code = OutputOpen(context->outputDbPath, DbOwner::kCaller, &out);
        if (code == QUIB_ERR_NONE) {
            // One transaction, synced at the checkpoint: the copy takes a fraction of a second,
            // and a table cut short by a crash is a search to run again, never a damaged file.
            out->batch = INT_MAX;
            code = Exec(out->db.get(), "PRAGMA synchronous=NORMAL");
        }
        std::string dir;
        auto keep = [&](const __tag_FI_FILE_INFO_DATA &record) -> int {
            if (context->filesAndFolders != 0 && !S_ISREG(record.mode) && !S_ISDIR(record.mode)) {
                return QUIB_ERR_NONE;
            }
            if (filter != nullptr) {
                dir = record.realPath;
                if (record.parentPath[0] != '\0') {
                    dir += '/';
                    dir += record.parentPath;
                }
                if (filter(dir.c_str(), record.name, context->filterArg) == 0) {
                    return QUIB_ERR_NONE;
                }
            }
            return OutputInsert(out.get(), record);
        };
        if (code == QUIB_ERR_NONE) {
            code = norvo::platform::QueryVolumeIndex(volume, conditions, folderConditions, keep);
        }
        if (code == QUIB_ERR_NONE) {
            code = OutputCommit(out.get());
        }
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXIndexBuild(const char *volume) {
    return Guarded(-1, [&] {
        const int code = norvo::platform::BuildVolumeIndex(volume);
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXIndexUpdate(const char *volume, unsigned long long *foldersRead) {
    return Guarded(-1, [&] {
        const int code = norvo::platform::UpdateVolumeIndex(volume, foldersRead);
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXIndexStatus(const char *volume, FI_INDEX_STATUS *status) {
    return Guarded(-1, [&] {
        if (status == nullptr) {
            return FILEIDX_FAIL(QUIB_ERR_BAD_PARAMETER);
        }
        const int code = norvo::platform::VolumeIndexStatus(volume, status);
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}

int FILEIDXIndexWatch(const char *volume, const volatile int *stop) {
    return Guarded(-1, [&] {
        if (stop == nullptr) {
            return FILEIDX_FAIL(QUIB_ERR_BAD_PARAMETER);
        }
        const int code = norvo::platform::WatchVolumeIndex(volume, stop);
        return code == QUIB_ERR_NONE ? 0 : FILEIDX_FAIL(code);
    });
}
