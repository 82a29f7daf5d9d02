// The SQLite side of the file index: opening a result database safely, and turning condition
// chains into SQL whose every value is bound.
#pragma once
#include <sqlite3.h>
#include <stdint.h>

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "fileidx.h"
#include "sqlite_db.h"

namespace norvo::platform {

using FileIdxDb = SqliteDb;
using FileIdxStatement = Statement;

// CodeOfSqlite, but a failure to open or read a file says the system's reason (ENOSPC, EACCES...).
[[nodiscard]] int FileIdxCodeOf(sqlite3 *db, int rc);

// Who may own a database that is opened.
enum class DbOwner {
    kCaller,  // the effective user (root opens anyone's)
    kRoot,    // root only: the volume index
};

// Creates the file at path exclusively (0600, no link followed on the way) and its schema.
// 0 or a platform code; a file that could not be made whole is removed again.
[[nodiscard]] int CreateFileIdxDb(const char *path);
// Opens an existing database read-write with our functions registered. 0 and *db, or a code.
[[nodiscard]] int OpenFileIdxDb(const char *path, DbOwner owner, FileIdxDb *db);
// An empty result database in memory, with our functions. 0 and *db, or a code.
[[nodiscard]] int OpenMemoryFileIdxDb(FileIdxDb *db);

// A statement's text with the values to bind, in order.
struct SqlText {
    struct Value {
        bool isText;
        int64_t number;
        std::string text;
    };
    std::string text;
    std::vector<Value> values;
};

// Appends "(<where>)" for the chain at head (see fileidx.h); "1" for null. 0 or 0x0D00.
[[nodiscard]] int AppendWhere(const __tag_FI_SQL_COND *head, SqlText *sql);
// Appends "col = ?, ..." for a set list. 0 or 0x0D00.
[[nodiscard]] int AppendSetList(const __tag_FI_SQL_COND *setList, SqlText *sql);
// Appends " ORDER BY ..." ending in the rowid. 0 or 0x0D00.
[[nodiscard]] int AppendOrder(const FI_QUERY &query, SqlText *sql);

// Prepares sql on db and binds its values. 0 or a code.
[[nodiscard]] int PrepareBound(sqlite3 *db, const SqlText &sql, FileIdxStatement *out);

// FI_OP_PATH_LIKE of pattern against path, as the SQL function does it.
[[nodiscard]] bool FileIdxPathLike(std::string_view pattern, std::string_view path);

// A component of an FI_OP_PATH_LIKE pattern: a lone "*" (one or more components), or a literal
// ("\" makes the next byte literal).
struct FileIdxPathPart {
    bool star = false;
    std::string literal;
};

// FileIdxPathLike with the pattern split once, for a pattern asked of many paths.
class FileIdxPathPattern {
public:
    explicit FileIdxPathPattern(std::string_view pattern);
    [[nodiscard]] bool Matches(std::string_view path);

private:
    std::vector<FileIdxPathPart> parts_;
    std::vector<std::string_view> path_;  // reused
};

// The columns of a hit in storage order, for SELECT and INSERT.
extern const char kFileIdxColumns[];
// Binds record's fields to parameters 1..18 of an INSERT of kFileIdxColumns. 0 or a code.
// The text is not copied: step the statement before record changes, and bind again before
// each step.
[[nodiscard]] int BindRecord(sqlite3_stmt *statement, const __tag_FI_FILE_INFO_DATA &record);
// Reads a row of "SELECT kFileIdxColumns" into *record.
void ReadRecord(sqlite3_stmt *statement, __tag_FI_FILE_INFO_DATA *record);

}  // namespace norvo::platform
