#include "fileidx_sql.h"

#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <set>
#include <string_view>

#include "api_guard.h"
#include "fs_path.h"
#include "locked_file.h"
#include "vlibc_err.h"
#include "vlibc_unicode.h"

namespace norvo::platform {
namespace {

constexpr int kBusyTimeoutMs = 5000;

// No custom collation or function in the schema, so the sqlite3 shell reads every database.
constexpr char kSchema[] =
    "PRAGMA journal_mode=WAL;"
    "CREATE TABLE fileinfo(name TEXT NOT NULL, real_path TEXT NOT NULL, parent_path TEXT NOT NULL, "
    "share TEXT NOT NULL, path TEXT NOT NULL, is_dir INTEGER NOT NULL, size INTEGER NOT NULL, "
    "type TEXT NOT NULL, crtime INTEGER NOT NULL, ctime INTEGER NOT NULL, atime INTEGER NOT NULL, "
    "mtime INTEGER NOT NULL, posix TEXT NOT NULL, mode INTEGER NOT NULL, uid INTEGER NOT NULL, "
    "gid INTEGER NOT NULL, user_name TEXT NOT NULL, group_name TEXT NOT NULL, UNIQUE(share, path));";

struct Column {
    const char *name;  // null: no such column code
    bool isText;
};

// By condition type code.
constexpr Column kColumns[] = {
    {"name", true},   {nullptr, false},  {"real_path", true}, {"parent_path", true}, {"share", true},
    {"path", true},   {"is_dir", false}, {"size", false},     {"type", true},        {"crtime", false},
    {"ctime", false}, {"atime", false},  {"mtime", false},    {"posix", true},       {"mode", false},
    {"uid", false},   {"gid", false},    {"user_name", true}, {"group_name", true},
};
constexpr unsigned kColumnCount = sizeof kColumns / sizeof kColumns[0];

const Column *ColumnOf(unsigned type) {
    return type < kColumnCount && kColumns[type].name != nullptr ? &kColumns[type] : nullptr;
}

// The operand of a record: its 4,096 bytes need not be terminated.
std::string Operand(const __tag_FI_SQL_COND &c) {
    return std::string(c.value, strnlen(c.value, sizeof c.value));
}

// "%llu" of a two's complement: digits only, at most 2^64 - 1, read back as signed.
bool ParseNumber(const std::string &text, int64_t *out) {
    if (text.empty() || text.size() > 20) {
        return false;
    }
    unsigned long long value = 0;
    for (const char c : text) {
        if (c < '0' || c > '9') {
            return false;
        }
        const unsigned digit = static_cast<unsigned>(c - '0');
        if (value > (~0ULL - digit) / 10) {
            return false;
        }
        value = value * 10 + digit;
    }
    *out = static_cast<int64_t>(value);
    return true;
}

int BindOperand(const Column &column, const __tag_FI_SQL_COND &c, bool numeric, SqlText *sql) {
    SqlText::Value value{!numeric, 0, Operand(c)};
    if (numeric && !ParseNumber(value.text, &value.number)) {
        return QUIB_ERR_BAD_PARAMETER;
    }
    (void)column;
    sql->text += '?';
    sql->values.push_back(std::move(value));
    return QUIB_ERR_NONE;
}

int AppendTerm(const __tag_FI_SQL_COND &c, SqlText *sql) {
    const Column *column = ColumnOf(c.type);
    if (column == nullptr) {
        return QUIB_ERR_BAD_PARAMETER;
    }
    const char *compare = nullptr;
    switch (c.op) {
        case FI_OP_EQ:
            compare = " = ";
            break;
        case FI_OP_LT:
            compare = " < ";
            break;
        case FI_OP_GT:
            compare = " > ";
            break;
        case FI_OP_GE:
            compare = " >= ";
            break;
        case FI_OP_LIKE:
        case FI_OP_PATH_LIKE:
        case FI_OP_PATH_NOT_LIKE:
            sql->text += c.op == FI_OP_LIKE        ? "fileidx_like("
                         : c.op == FI_OP_PATH_LIKE ? "fileidx_path_like("
                                                   : "NOT fileidx_path_like(";
            if (const int code = BindOperand(*column, c, false, sql)) {
                return code;
            }
            sql->text += ", ";
            sql->text += column->name;
            sql->text += ')';
            return QUIB_ERR_NONE;
        default:
            return QUIB_ERR_BAD_PARAMETER;
    }
    sql->text += column->name;
    sql->text += compare;
    return BindOperand(*column, c, !column->isText, sql);
}

// Joins parts[from, to) with op in a balanced tree of parentheses, so a long list never
// exceeds SQLite's expression depth.
void JoinBalanced(const std::vector<SqlText> &parts, size_t from, size_t to, const char *op, SqlText *sql) {
    if (to - from == 1) {
        sql->text += parts[from].text;
        sql->values.insert(sql->values.end(), parts[from].values.begin(), parts[from].values.end());
        return;
    }
    const size_t middle = from + (to - from) / 2;
    sql->text += '(';
    JoinBalanced(parts, from, middle, op, sql);
    sql->text += op;
    JoinBalanced(parts, middle, to, op, sql);
    sql->text += ')';
}

// Collects the conjuncts of a chain flat (each an OR group of one record's alternatives), so
// neither a long conjunction nor a long alternative nests deeper than log2 of its length.
class ChainReader {
public:
    int Read(const __tag_FI_SQL_COND *head, std::vector<SqlText> *conjuncts) {
        std::vector<SqlText> alternatives;
        std::vector<const __tag_FI_SQL_COND *> further;
        for (const __tag_FI_SQL_COND *c = head; c != nullptr; c = c->orNext) {
            if (!seen_.insert(c).second || seen_.size() > FILEIDX_MAX_CONDS) {
                return QUIB_ERR_BAD_PARAMETER;
            }
            alternatives.emplace_back();
            if (const int code = AppendTerm(*c, &alternatives.back())) {
                return code;
            }
            if (c->andNext != nullptr) {
                further.push_back(c->andNext);
            }
        }
        conjuncts->emplace_back();
        JoinBalanced(alternatives, 0, alternatives.size(), " OR ", &conjuncts->back());
        for (const __tag_FI_SQL_COND *next : further) {
            if (const int code = Read(next, conjuncts)) {
                return code;
            }
        }
        return QUIB_ERR_NONE;
    }

private:
    std::set<const __tag_FI_SQL_COND *> seen_;
};

std::vector<FileIdxPathPart> SplitPattern(std::string_view pattern) {
    std::vector<FileIdxPathPart> parts(1);
    bool escaped = false;
    bool anyEscape = false;
    for (const char c : pattern) {
        if (!escaped && c == '\\') {
            escaped = anyEscape = true;
            continue;
        }
        if (!escaped && c == '/') {
            parts.back().star = !anyEscape && parts.back().literal == "*";
            parts.emplace_back();
            anyEscape = false;
            continue;
        }
        parts.back().literal += c;
        escaped = false;
    }
    parts.back().star = !anyEscape && parts.back().literal == "*";
    return parts;
}

void SplitPath(std::string_view path, std::vector<std::string_view> *parts) {
    parts->clear();
    size_t from = 0;
    for (;;) {
        const size_t slash = path.find('/', from);
        parts->push_back(
            path.substr(from, slash == std::string_view::npos ? std::string_view::npos : slash - from));
        if (slash == std::string_view::npos) {
            return;
        }
        from = slash + 1;
    }
}

// A star is one component followed by any number, so only the last star ever backtracks.
bool PathLikeMatch(const std::vector<FileIdxPathPart> &p, const std::vector<std::string_view> &s) {
    size_t i = 0;
    size_t j = 0;
    size_t starAt = SIZE_MAX;
    size_t resume = 0;
    while (j < s.size()) {
        if (i < p.size() && p[i].star) {
            starAt = i++;
            resume = ++j;  // the star's first component
        } else if (i < p.size() && p[i].literal == s[j]) {
            ++i;
            ++j;
        } else if (starAt != SIZE_MAX) {
            i = starAt + 1;
            j = ++resume;
        } else {
            return false;
        }
    }
    return i == p.size();
}

bool PathLikeMatch(std::string_view pattern, std::string_view path) {
    std::vector<std::string_view> parts;
    SplitPath(path, &parts);
    return PathLikeMatch(SplitPattern(pattern), parts);
}

std::string_view TextOf(sqlite3_value *value) {
    const unsigned char *text = sqlite3_value_text(value);
    return text == nullptr ? std::string_view()
                           : std::string_view(reinterpret_cast<const char *>(text),
                                              static_cast<size_t>(sqlite3_value_bytes(value)));
}

void LikeFunction(sqlite3_context *context, int, sqlite3_value **args) {
    const unsigned char *pattern = sqlite3_value_text(args[0]);
    const unsigned char *subject = sqlite3_value_text(args[1]);
    if (pattern == nullptr || subject == nullptr) {
        sqlite3_result_int(context, 0);
        return;
    }
    sqlite3_result_int(context, VLIBCUnicodeUTF8LikeMatch(reinterpret_cast<const char *>(pattern),
                                                          reinterpret_cast<const char *>(subject), '\\'));
}

void PathLikeFunction(sqlite3_context *context, int, sqlite3_value **args) {
    if (sqlite3_value_type(args[1]) == SQLITE_NULL) {
        sqlite3_result_int(context, 0);
        return;
    }
    try {  // no exception may cross SQLite's C frames
        sqlite3_result_int(context, PathLikeMatch(TextOf(args[0]), TextOf(args[1])) ? 1 : 0);
    } catch (...) {
        sqlite3_result_error_nomem(context);
    }
}

// VLIBCUnicodeUTF8StrCaseCmp takes terminated strings; most names fit on the stack.
int NoCaseCollation(void *, int size1, const void *text1, int size2, const void *text2) {
    char small1[256];
    char small2[256];
    std::string big1;
    std::string big2;
    auto terminated = [](int size, const void *text, char *small, std::string *big) -> const char * {
        const size_t n = static_cast<size_t>(size);
        if (n < 256) {
            memcpy(small, text, n);
            small[n] = '\0';
            return small;
        }
        big->assign(static_cast<const char *>(text), n);
        return big->c_str();
    };
    try {
        return VLIBCUnicodeUTF8StrCaseCmp(terminated(size1, text1, small1, &big1),
                                          terminated(size2, text2, small2, &big2));
    } catch (...) {
        return 0;  // out of memory with a name over 255 bytes: order undefined, never a crash
    }
}

int RegisterFunctions(sqlite3 *db) {
    constexpr int kFlags = SQLITE_UTF8 | SQLITE_DETERMINISTIC | SQLITE_INNOCUOUS;
    int rc = sqlite3_create_function_v2(db, "fileidx_like", 2, kFlags, nullptr, LikeFunction, nullptr,
                                        nullptr, nullptr);
    if (rc == SQLITE_OK) {
        rc = sqlite3_create_function_v2(db, "fileidx_path_like", 2, kFlags, nullptr, PathLikeFunction,
                                        nullptr, nullptr, nullptr);
    }
    if (rc == SQLITE_OK) {
        rc =
            sqlite3_create_collation_v2(db, "fileidx_nocase", SQLITE_UTF8, nullptr, NoCaseCollation, nullptr);
    }
    return CodeOfSqlite(rc);
}

// A link or a non-directory where a directory must be is a refusal, not a system failure.
int CodeOfOpen(int err) {
    return err == ELOOP || err == ENOTDIR ? QUIB_ERR_ACCESS_DENIED : VLIBCErrFromErrno(err);
}

// Opens the folder of path component by component, never through a link. 0 and *dir and
// *name (the last component), or a code.
int OpenParent(const char *path, FileDescriptor *dir, std::string *name) {
    if (const int err = CheckPathArgument(path)) {
        return VLIBCErrFromErrno(err);
    }
    const std::string_view whole(path);
    const size_t last = whole.find_last_of('/');
    *name = std::string(last == std::string_view::npos ? whole : whole.substr(last + 1));
    if (name->empty() || *name == "." || *name == "..") {
        return QUIB_ERR_BAD_PARAMETER;
    }
    dir->Reset(open(whole[0] == '/' ? "/" : ".", O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!dir->IsOpen()) {
        return VLIBCErrFromErrno(errno);
    }
    if (last == std::string_view::npos) {
        return QUIB_ERR_NONE;
    }
    size_t from = 0;
    while (from < last) {
        size_t slash = whole.find('/', from);
        if (slash > last) {
            slash = last;
        }
        const std::string component(whole.substr(from, slash - from));
        from = slash + 1;
        if (component.empty() || component == ".") {
            continue;
        }
        FileDescriptor next(
            openat(dir->Get(), component.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        if (!next.IsOpen()) {
            return CodeOfOpen(errno);
        }
        *dir = std::move(next);
    }
    return QUIB_ERR_NONE;
}

// The database and the journal files SQLite opens beside it by name: each must be a regular
// file of the database's owner with one link, or (journals) absent. In a folder others may
// write, a file planted there would otherwise be read as ours, or receive our hits.
int CheckFiles(int dir, const std::string &name, DbOwner owner) {
    struct stat db;
    if (fstatat(dir, name.c_str(), &db, AT_SYMLINK_NOFOLLOW) != 0) {
        return VLIBCErrFromErrno(errno);
    }
    const uid_t self = geteuid();
    const bool ownerOk = owner == DbOwner::kRoot ? db.st_uid == 0 : db.st_uid == self || self == 0;
    if (!S_ISREG(db.st_mode) || db.st_nlink != 1 || !ownerOk) {
        return QUIB_ERR_ACCESS_DENIED;
    }
    for (const char *suffix : {"-wal", "-shm", "-journal"}) {
        struct stat st;
        if (fstatat(dir, (name + suffix).c_str(), &st, AT_SYMLINK_NOFOLLOW) != 0) {
            if (errno == ENOENT) {
                continue;
            }
            return VLIBCErrFromErrno(errno);
        }
        if (!S_ISREG(st.st_mode) || st.st_nlink != 1 || st.st_uid != db.st_uid) {
            return QUIB_ERR_ACCESS_DENIED;
        }
    }
    return QUIB_ERR_NONE;
}

int Open(const char *path, FileIdxDb *db) {
    sqlite3 *raw = nullptr;
    // NOFOLLOW: SQLite refuses a link in any component of the name it opens. NOMUTEX: a
    // connection serves one call, or one output handle used by one thread at a time; the
    // per-call locking was a tenth of the time of a copy into a result database.
    const int rc = sqlite3_open_v2(
        path, &raw, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOFOLLOW | SQLITE_OPEN_NOMUTEX, nullptr);
    db->reset(raw);
    if (rc != SQLITE_OK) {
        return sqlite3_extended_errcode(raw) == SQLITE_CANTOPEN_SYMLINK ? QUIB_ERR_ACCESS_DENIED
                                                                        : FileIdxCodeOf(raw, rc);
    }
    sqlite3_busy_timeout(raw, kBusyTimeoutMs);
    return RegisterFunctions(raw);
}

}  // namespace

bool FileIdxPathLike(std::string_view pattern, std::string_view path) {
    return PathLikeMatch(pattern, path);
}

FileIdxPathPattern::FileIdxPathPattern(std::string_view pattern) : parts_(SplitPattern(pattern)) {}

bool FileIdxPathPattern::Matches(std::string_view path) {
    SplitPath(path, &path_);
    return PathLikeMatch(parts_, path_);
}

const char kFileIdxColumns[] =
    "name, real_path, parent_path, share, path, is_dir, size, type, crtime, ctime, atime, mtime, posix, mode, "
    "uid, gid, user_name, group_name";

int FileIdxCodeOf(sqlite3 *db, int rc) {
    const int primary = rc & 0xFF;
    if (db != nullptr && (primary == SQLITE_CANTOPEN || primary == SQLITE_IOERR || primary == SQLITE_FULL)) {
        if (const int err = sqlite3_system_errno(db)) {
            return VLIBCErrFromErrno(err);
        }
    }
    return CodeOfSqlite(rc);
}

int CreateFileIdxDb(const char *path) {
    FileDescriptor dir;
    std::string name;
    if (const int code = OpenParent(path, &dir, &name)) {
        return code;
    }
    {
        FileDescriptor file(
            openat(dir.Get(), name.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
        if (!file.IsOpen()) {
            return errno == EEXIST || errno == ELOOP ? QUIB_ERR_ACCESS_DENIED : VLIBCErrFromErrno(errno);
        }
        if (fchmod(file.Get(), 0600) != 0) {  // the umask only takes bits away, but be exact
            const int err = errno;
            unlinkat(dir.Get(), name.c_str(), 0);
            return VLIBCErrFromErrno(err);
        }
    }
    ScopeExit removeOnFailure([&] { unlinkat(dir.Get(), name.c_str(), 0); });
    FileIdxDb db;
    int code = CheckFiles(dir.Get(), name, DbOwner::kCaller);
    if (code != QUIB_ERR_NONE) {
        return code;  // the journals beside it are someone else's: leave them alone
    }
    code = Open(path, &db);
    if (code == QUIB_ERR_NONE) {
        code = FileIdxCodeOf(db.get(), sqlite3_exec(db.get(), kSchema, nullptr, nullptr, nullptr));
    }
    if (code == QUIB_ERR_NONE) {
        code = CodeOfSqlite(sqlite3_close(db.release()));
    }
    if (code != QUIB_ERR_NONE) {
        db.reset();
        for (const char *suffix : {"-wal", "-shm", "-journal"}) {  // ours, or absent when checked
            unlinkat(dir.Get(), (name + suffix).c_str(), 0);
        }
        return code;
    }
    removeOnFailure.Dismiss();
    return QUIB_ERR_NONE;
}

int OpenFileIdxDb(const char *path, DbOwner owner, FileIdxDb *db) {
    FileDescriptor dir;
    std::string name;
    if (const int code = OpenParent(path, &dir, &name)) {
        return code;
    }
    if (const int code = CheckFiles(dir.Get(), name, owner)) {
        return code;
    }
    return Open(path, db);
}

int OpenMemoryFileIdxDb(FileIdxDb *db) {
    sqlite3 *raw = nullptr;
    const int rc = sqlite3_open_v2(":memory:", &raw,
                                   SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX, nullptr);
    db->reset(raw);
    if (rc != SQLITE_OK) {
        return FileIdxCodeOf(raw, rc);
    }
    if (const int code = RegisterFunctions(raw)) {
        return code;
    }
    return FileIdxCodeOf(raw, sqlite3_exec(raw, kSchema, nullptr, nullptr, nullptr));
}

int AppendWhere(const __tag_FI_SQL_COND *head, SqlText *sql) {
    if (head == nullptr) {
        sql->text += '1';
        return QUIB_ERR_NONE;
    }
    std::vector<SqlText> conjuncts;
    if (const int code = ChainReader().Read(head, &conjuncts)) {
        return code;
    }
    SqlText where;
    JoinBalanced(conjuncts, 0, conjuncts.size(), " AND ", &where);
    sql->text += '(' + where.text + ')';
    sql->values.insert(sql->values.end(), where.values.begin(), where.values.end());
    return QUIB_ERR_NONE;
}

int AppendSetList(const __tag_FI_SQL_COND *setList, SqlText *sql) {
    if (setList == nullptr) {
        return QUIB_ERR_BAD_PARAMETER;
    }
    std::set<const __tag_FI_SQL_COND *> seen;
    for (const __tag_FI_SQL_COND *c = setList; c != nullptr; c = c->orNext) {
        const Column *column = ColumnOf(c->type);
        if (column == nullptr || c->op != FI_OP_EQ || c->andNext != nullptr || !seen.insert(c).second ||
            seen.size() > FILEIDX_MAX_CONDS) {
            return QUIB_ERR_BAD_PARAMETER;
        }
        sql->text += c == setList ? "" : ", ";
        sql->text += column->name;
        sql->text += " = ";
        if (const int code = BindOperand(*column, *c, !column->isText, sql)) {
            return code;
        }
    }
    return QUIB_ERR_NONE;
}

int AppendOrder(const FI_QUERY &query, SqlText *sql) {
    if (query.sortCount > FI_MAX_SORT_KEYS) {
        return QUIB_ERR_BAD_PARAMETER;
    }
    sql->text += " ORDER BY ";
    for (unsigned i = 0; i < query.sortCount; ++i) {
        const Column *column = ColumnOf(query.sort[i].type);
        if (column == nullptr) {
            return QUIB_ERR_BAD_PARAMETER;
        }
        sql->text += column->name;
        sql->text += column->isText ? " COLLATE fileidx_nocase" : "";
        sql->text += query.sort[i].desc ? " DESC, " : ", ";
    }
    // The collation orders different bytes apart, but equal keys are common (sizes, types):
    // storage order settles them, the same for every page.
    sql->text += "rowid";
    return QUIB_ERR_NONE;
}

int PrepareBound(sqlite3 *db, const SqlText &sql, FileIdxStatement *out) {
    sqlite3_stmt *raw = nullptr;
    const int rc = sqlite3_prepare_v2(db, sql.text.c_str(), static_cast<int>(sql.text.size()), &raw, nullptr);
    out->reset(raw);
    if (rc != SQLITE_OK) {
        return FileIdxCodeOf(db, rc);
    }
    int index = 0;
    for (const SqlText::Value &value : sql.values) {
        ++index;
        const int bound = value.isText
                              ? sqlite3_bind_text(raw, index, value.text.data(),
                                                  static_cast<int>(value.text.size()), SQLITE_TRANSIENT)
                              : sqlite3_bind_int64(raw, index, value.number);
        if (bound != SQLITE_OK) {
            return CodeOfSqlite(bound);
        }
    }
    return QUIB_ERR_NONE;
}

int BindRecord(sqlite3_stmt *statement, const __tag_FI_FILE_INFO_DATA &r) {
    int index = 0;
    int rc = SQLITE_OK;
    auto text = [&](const char *field, size_t size) {
        if (rc == SQLITE_OK) {
            rc = sqlite3_bind_text(statement, ++index, field, static_cast<int>(strnlen(field, size)),
                                   SQLITE_STATIC);
        }
    };
    auto number = [&](long long value) {
        if (rc == SQLITE_OK) {
            rc = sqlite3_bind_int64(statement, ++index, value);
        }
    };
    text(r.name, sizeof r.name);
    text(r.realPath, sizeof r.realPath);
    text(r.parentPath, sizeof r.parentPath);
    text(r.share, sizeof r.share);
    text(r.path, sizeof r.path);
    number(r.isDir);
    number(r.size);
    text(r.type, sizeof r.type);
    number(r.crtime);
    number(r.ctime);
    number(r.atime);
    number(r.mtime);
    text(r.posix, sizeof r.posix);
    number(r.mode);
    number(r.uid);
    number(r.gid);
    text(r.userName, sizeof r.userName);
    text(r.groupName, sizeof r.groupName);
    return CodeOfSqlite(rc);
}

void ReadRecord(sqlite3_stmt *statement, __tag_FI_FILE_INFO_DATA *r) {
    int index = 0;
    auto text = [&](char *field, size_t size) {
        const unsigned char *value = sqlite3_column_text(statement, index);
        const size_t length =
            value == nullptr ? 0 : static_cast<size_t>(sqlite3_column_bytes(statement, index));
        ++index;
        const size_t kept = length < size ? length : size - 1;
        if (kept > 0) {
            memcpy(field, value, kept);
        }
        field[kept] = '\0';
    };
    auto number = [&] { return sqlite3_column_int64(statement, index++); };
    text(r->name, sizeof r->name);
    text(r->realPath, sizeof r->realPath);
    text(r->parentPath, sizeof r->parentPath);
    text(r->share, sizeof r->share);
    text(r->path, sizeof r->path);
    r->isDir = static_cast<int>(number());
    r->size = number();
    text(r->type, sizeof r->type);
    r->crtime = number();
    r->ctime = number();
    r->atime = number();
    r->mtime = number();
    text(r->posix, sizeof r->posix);
    r->mode = static_cast<unsigned>(number());
    r->uid = static_cast<unsigned>(number());
    r->gid = static_cast<unsigned>(number());
    text(r->userName, sizeof r->userName);
    text(r->groupName, sizeof r->groupName);
}

}  // namespace norvo::platform
