// The volume index: one row per folder (its place, its identity and times, and the names in it
// as one blob) and a contentless FTS5 trigram table over the names. A folder's names have the
// consecutive keys first .. first + count - 1 in the trigram table, new ones each time the folder
// is read: dense keys keep the trigram lists' deltas small. A query takes candidates by name and folder from
// it and looks at each candidate live, so what it returns is what a walk would find now, less what the index
// has not seen.
#include "volume_index.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <stdint.h>
#include <string.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

#include <unicode/uchar.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <chrono>
#include <map>
#include <memory>
#include <set>
#include <unordered_map>

#include "api_guard.h"
#include "fileidx_sql.h"
#include "fs_path.h"
#include "locked_file.h"
#include "nss.h"
#include "private_dir.h"
#include "quib_share.h"
#include "vlibc_err.h"
#include "vlibc_unicode.h"

namespace norvo::platform {
namespace {

constexpr char kIndexDir[] = "@fileidx";
constexpr char kIndexName[] = "fileidx.db";
constexpr char kScratchName[] = "fileidx.db.new";
constexpr char kLockName[] = "fileidx.lock";
constexpr char kVersion[] = "2";
// The most names a folder keeps (more are left out of the index).
constexpr size_t kMaxNames = 1 << 24;
constexpr int kMaxDepth = 256;  // a descriptor per level is held while walking and querying
constexpr int kRootId = 1;

constexpr char kIndexSchema[] =
    "CREATE TABLE meta(key TEXT PRIMARY KEY, value) WITHOUT ROWID;"
    "CREATE TABLE folders(id INTEGER PRIMARY KEY, parent INTEGER NOT NULL, name BLOB NOT NULL, "
    "dev INTEGER NOT NULL, ino INTEGER NOT NULL, ctime INTEGER NOT NULL, mtime INTEGER NOT NULL, "
    "first INTEGER NOT NULL, count INTEGER NOT NULL, names BLOB NOT NULL);"
    "CREATE VIRTUAL TABLE names USING fts5(name, content='', detail='none', columnsize=0, "
    "tokenize='trigram case_sensitive 1');";

// ---- names and trigrams ----------------------------------------------------------------------

// Decodes one character as VLIBCUnicodeUTF8LikeMatch does (like_match.cc): the trail bytes
// counted from the lead byte, unvalidated, cut at the terminating NUL.
const uint8_t *Decode(const uint8_t *text, UChar32 *c) {
    UChar32 value = *text++;
    if (value < 0xC0 || value > 0xF4) {
        *c = value;
        return text;
    }
    const int trail = value >= 0xC2 ? U8_COUNT_TRAIL_BYTES(value) : 1;
    value &= (1 << (6 - trail)) - 1;
    for (int i = 0; i < trail && *text != 0; ++i) {
        value = (value << 6) | (*text++ & 0x3F);
    }
    *c = value;
    return text;
}

// The folded ASCII a subject character matches, or 0x01 for one that matches no ASCII literal
// (above ASCII only U+017F and U+212A fold into it).
char IndexChar(UChar32 c) {
    if (c > 0 && c < 0x80) {
        return static_cast<char>(c >= 'A' && c <= 'Z' ? c + ('a' - 'A') : c);
    }
    return c == 0x17F ? 's' : c == 0x212A ? 'k' : '\x01';
}

void AddTrigrams(const std::string &run, std::set<std::string> *out) {
    for (size_t i = 0; i + 3 <= run.size(); ++i) {
        out->insert(run.substr(i, 3));
    }
}

std::string MatchQuery(const std::vector<std::string> &trigrams) {
    std::string query;
    for (const std::string &t : trigrams) {
        query += query.empty() ? "\"" : " AND \"";
        for (const char c : t) {
            query += c;
            if (c == '"') {
                query += '"';
            }
        }
        query += '"';
    }
    return query;
}

// A folder's names, sorted, front-coded: for each, one byte of the length it shares with the
// one before (names are at most 255 bytes), the rest of it, and a NUL.
std::vector<std::string> SplitNames(const void *blob, int size, size_t most = SIZE_MAX) {
    std::vector<std::string> names;
    const char *p = static_cast<const char *>(blob);
    const char *end = p + (size > 0 ? size : 0);
    std::string previous;
    while (p < end && names.size() < most) {
        const size_t shared =
            std::min(static_cast<size_t>(static_cast<unsigned char>(*p++)), previous.size());
        const char *nul = static_cast<const char *>(memchr(p, '\0', static_cast<size_t>(end - p)));
        const char *stop = nul == nullptr ? end : nul;
        previous.resize(shared);
        previous.append(p, stop);
        names.push_back(previous);
        p = stop + 1;
    }
    return names;
}

std::string JoinNames(const std::vector<std::string> &names) {
    std::string blob;
    const std::string *previous = nullptr;
    for (const std::string &n : names) {
        size_t shared = 0;
        if (previous != nullptr) {
            const size_t most = std::min({previous->size(), n.size(), size_t{255}});
            while (shared < most && (*previous)[shared] == n[shared]) {
                ++shared;
            }
        }
        blob += static_cast<char>(shared);
        blob.append(n, shared, std::string::npos);
        blob += '\0';
        previous = &n;
    }
    return blob;
}

// Text into a record's field, cut to fit, always terminated.
void Copy(const std::string &text, char *field, size_t size) {
    const size_t n = std::min(text.size(), size - 1);
    memcpy(field, text.data(), n);
    field[n] = '\0';
}

// ---- small system helpers ----------------------------------------------------------------------

int64_t Nanos(const struct timespec &t) {
    return static_cast<int64_t>(t.tv_sec) * 1000000000 + t.tv_nsec;
}

// Opens an absolute or relative directory path from "/" (or ".") without following a link.
int OpenDirNoFollow(const std::string &path, int flags, FileDescriptor *out) {
    FileDescriptor dir(open(!path.empty() && path[0] == '/' ? "/" : ".", O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!dir.IsOpen()) {
        return errno;
    }
    size_t from = 0;
    while (from <= path.size()) {
        size_t slash = path.find('/', from);
        if (slash == std::string::npos) {
            slash = path.size();
        }
        const std::string component = path.substr(from, slash - from);
        from = slash + 1;
        if (component.empty() || component == ".") {
            continue;
        }
        FileDescriptor next(
            openat(dir.Get(), component.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        if (!next.IsOpen()) {
            return errno;
        }
        dir = std::move(next);
    }
    if (flags != O_PATH) {
        FileDescriptor readable(openat(dir.Get(), ".", flags | O_DIRECTORY | O_CLOEXEC));
        if (!readable.IsOpen()) {
            return errno;
        }
        dir = std::move(readable);
    }
    *out = std::move(dir);
    return 0;
}

struct Entry {
    std::string name;
    bool isDir;
};

// The entries of the directory open at fd (getdents64), "." and ".." left out, sorted by bytes.
int ReadEntries(int fd, bool top, std::vector<Entry> *out) {
    out->clear();
    if (lseek(fd, 0, SEEK_SET) < 0) {
        return errno;
    }
    alignas(8) char buffer[32768];
    for (;;) {
        const long n = syscall(SYS_getdents64, fd, buffer, sizeof buffer);
        if (n < 0) {
            return errno;
        }
        if (n == 0) {
            break;
        }
        for (long at = 0; at < n;) {
            const auto *d = reinterpret_cast<const struct dirent64 *>(buffer + at);
            at += d->d_reclen;
            const char *name = d->d_name;
            if (strcmp(name, ".") == 0 || strcmp(name, "..") == 0) {
                continue;
            }
            if (top && (strcmp(name, "@tmp") == 0 || strcmp(name, kIndexDir) == 0)) {
                continue;
            }
            bool isDir = d->d_type == DT_DIR;
            if (d->d_type == DT_UNKNOWN) {
                struct stat st;
                isDir = fstatat(fd, name, &st, AT_SYMLINK_NOFOLLOW) == 0 && S_ISDIR(st.st_mode);
            }
            out->push_back({name, isDir});
        }
    }
    std::sort(out->begin(), out->end(), [](const Entry &a, const Entry &b) { return a.name < b.name; });
    if (out->size() > kMaxNames) {
        out->resize(kMaxNames);
    }
    return 0;
}

// The effective user is root for the life of this object when the saved user is, so that root's
// index can be read; it is given back at the end (or the process ends rather than run on as root).
class RootForRead {
public:
    RootForRead() {
        uid_t real, effective, saved;
        if (getresuid(&real, &effective, &saved) == 0 && effective != 0 && saved == 0) {
            raised_ = seteuid(0) == 0;
            user_ = effective;
        }
    }
    ~RootForRead() {
        if (raised_ && seteuid(user_) != 0) {
            abort();
        }
    }
    RootForRead(const RootForRead &) = delete;
    RootForRead &operator=(const RootForRead &) = delete;

private:
    bool raised_ = false;
    uid_t user_ = 0;
};

std::string IndexDirOf(const char *volume) {
    return AbsolutePath(volume) + "/" + kIndexDir;
}

// Opens volume's index (root's, checked as any file index database) for this call.
int OpenIndex(const char *volume, FileIdxDb *db) {
    if (const int err = CheckPathArgument(volume)) {
        return VLIBCErrFromErrno(err);
    }
    FileDescriptor dir;
    if (const int code = OpenPrivateDir(IndexDirOf(volume), false, &dir)) {
        return code;
    }
    const std::string path = IndexDirOf(volume) + "/" + kIndexName;
    if (const int code = OpenFileIdxDb(path.c_str(), DbOwner::kRoot, db)) {
        return code;
    }
    sqlite3_exec(db->get(), "PRAGMA query_only=1", nullptr, nullptr, nullptr);
    return QUIB_ERR_NONE;
}

int CheckReady(sqlite3 *db) {
    Statement s;
    if (const int code = Prepare(db, "SELECT value FROM meta WHERE key = 'version'", &s)) {
        return code;
    }
    const int rc = sqlite3_step(s.get());
    if (rc != SQLITE_ROW) {
        return rc == SQLITE_DONE ? QUIB_ERR_FAILED : FileIdxCodeOf(db, rc);
    }
    const unsigned char *v = sqlite3_column_text(s.get(), 0);
    return v != nullptr && strcmp(reinterpret_cast<const char *>(v), kVersion) == 0 ? QUIB_ERR_NONE
                                                                                    : QUIB_ERR_FAILED;
}

// ---- reading chains for candidates -----------------------------------------------------------

using Alternatives = std::vector<const __tag_FI_SQL_COND *>;

// The conjuncts of a chain, each the alternatives reached through orNext from one record.
// false for a chain the exact evaluation will refuse anyway.
bool Conjuncts(const __tag_FI_SQL_COND *head, std::set<const __tag_FI_SQL_COND *> *seen,
               std::vector<Alternatives> *out) {
    Alternatives alternatives;
    std::vector<const __tag_FI_SQL_COND *> further;
    for (const __tag_FI_SQL_COND *c = head; c != nullptr; c = c->orNext) {
        if (!seen->insert(c).second || seen->size() > FILEIDX_MAX_CONDS) {
            return false;
        }
        alternatives.push_back(c);
        if (c->andNext != nullptr) {
            further.push_back(c->andNext);
        }
    }
    if (!alternatives.empty()) {
        out->push_back(std::move(alternatives));
    }
    for (const __tag_FI_SQL_COND *next : further) {
        if (!Conjuncts(next, seen, out)) {
            return false;
        }
    }
    return true;
}

std::string Operand(const __tag_FI_SQL_COND &c) {
    return std::string(c.value, strnlen(c.value, sizeof c.value));
}

// What an FI_OP_PATH_LIKE or FI_OP_EQ term of code 5 says about the folder of a row: its
// leading literal components, and whether a star follows them.
struct PathPrefix {
    std::vector<std::string> literal;
    bool star;
};

PathPrefix PrefixOf(const std::string &pattern, bool like) {
    PathPrefix prefix{{}, false};
    std::vector<std::pair<std::string, bool>> parts(1, {"", false});  // text, had an escape
    bool escaped = false;
    for (const char c : pattern) {
        if (like && !escaped && c == '\\') {
            escaped = parts.back().second = true;
            continue;
        }
        if (!escaped && c == '/') {
            parts.push_back({"", false});
            continue;
        }
        parts.back().first += c;
        escaped = false;
    }
    for (const auto &part : parts) {
        if (like && !part.second && part.first == "*") {
            prefix.star = true;
            break;
        }
        prefix.literal.push_back(part.first);
    }
    return prefix;
}

// Whether a row in the folder at path (components below the share) may satisfy the prefix.
bool FolderMayMatch(const std::vector<std::string> &folder, const PathPrefix &p) {
    if (p.star) {
        return folder.size() >= p.literal.size() &&
               std::equal(p.literal.begin(), p.literal.end(), folder.begin());
    }
    return !p.literal.empty() && folder.size() + 1 == p.literal.size() &&
           std::equal(folder.begin(), folder.end(), p.literal.begin());
}

// What both chains say about where and by which names candidates may lie; every part a
// superset of the rows the chains select.
struct Plan {
    bool namesKnown = false;                       // else every name is a candidate
    std::vector<std::vector<std::string>> byName;  // the alternatives' trigrams
    std::vector<std::vector<PathPrefix>> pathOr;   // each: one of its prefixes must hold
    std::vector<std::set<std::string>> shareOr;    // each: the share is one of these
    std::vector<Alternatives> nameOr;              // each: one of its name terms holds
};

// Whether a name satisfies every conjunct of name terms (before its status is looked at).
bool NameMayMatch(const Plan &plan, const std::string &name) {
    for (const Alternatives &alts : plan.nameOr) {
        bool any = false;
        for (size_t i = 0; !any && i < alts.size(); ++i) {
            const std::string operand = Operand(*alts[i]);
            any = alts[i]->op == FI_OP_LIKE
                      ? VLIBCUnicodeUTF8LikeMatch(operand.c_str(), name.c_str(), '\\') != 0
                      : operand == name;
        }
        if (!any) {
            return false;
        }
    }
    return true;
}

void ReadPlan(const __tag_FI_SQL_COND *chain, Plan *plan) {
    std::set<const __tag_FI_SQL_COND *> seen;
    std::vector<Alternatives> conjuncts;
    if (chain == nullptr || !Conjuncts(chain, &seen, &conjuncts)) {
        return;
    }
    for (const Alternatives &alts : conjuncts) {
        bool names = true, paths = true, shares = true;
        for (const __tag_FI_SQL_COND *c : alts) {
            names = names && c->type == FI_COND_NAME && (c->op == FI_OP_LIKE || c->op == FI_OP_EQ);
            paths = paths && c->type == FI_COND_PATH && (c->op == FI_OP_PATH_LIKE || c->op == FI_OP_EQ);
            shares = shares && c->type == FI_COND_SHARE && c->op == FI_OP_EQ;
        }
        if (names) {
            plan->nameOr.push_back(alts);
        }
        if (names && !plan->namesKnown) {
            std::vector<std::vector<std::string>> byName;
            for (const __tag_FI_SQL_COND *c : alts) {
                byName.push_back(NameTrigrams(Operand(*c), c->op == FI_OP_LIKE));
                if (byName.back().empty()) {
                    names = false;
                    break;
                }
            }
            if (names) {
                plan->namesKnown = true;
                plan->byName = std::move(byName);
            }
        } else if (paths) {
            plan->pathOr.emplace_back();
            for (const __tag_FI_SQL_COND *c : alts) {
                plan->pathOr.back().push_back(PrefixOf(Operand(*c), c->op == FI_OP_PATH_LIKE));
            }
        } else if (shares) {
            plan->shareOr.emplace_back();
            for (const __tag_FI_SQL_COND *c : alts) {
                plan->shareOr.back().insert(Operand(*c));
            }
        }
    }
}

// ---- the query ---------------------------------------------------------------------------------

struct Share {
    std::string name;
    std::string realPath;            // the share's folder
    std::vector<std::string> below;  // its components below the volume
};

struct QueryFolder {
    int64_t parent;
    std::string name;
    int share = -2;                 // -2 not placed yet, -1 outside every share
    bool reachable = false;         // its parents lead to the volume
    std::vector<std::string> full;  // components below the volume
    std::vector<std::string> path;  // components below the share
    std::string parentPath;         // of its entries: path joined by "/"
    bool relevant = false;
};

int ReadShares(const std::string &volume, std::vector<Share> *out) {
    PQUIBSHARE_DB cursor = QUIBShareDBOpen();
    if (cursor == nullptr) {
        return QUIB_ERR_OPEN_FAILED;
    }
    PQUIBSHARE share = nullptr;
    int rc;
    while ((rc = QUIBShareDBCursorGet(cursor, &share)) == 0) {
        const std::string path = AbsolutePath(share->szPath);
        if (path.size() > volume.size() + 1 && path.compare(0, volume.size(), volume) == 0 &&
            path[volume.size()] == '/') {
            Share s{share->szName, path, {}};
            const std::string rest = path.substr(volume.size() + 1);
            size_t from = 0;
            while (from <= rest.size()) {
                size_t slash = rest.find('/', from);
                if (slash == std::string::npos) {
                    slash = rest.size();
                }
                s.below.push_back(rest.substr(from, slash - from));
                from = slash + 1;
            }
            out->push_back(std::move(s));
        }
    }
    QUIBShareFree(share);
    QUIBShareDBClose(cursor);
    return rc < 0 ? QUIB_ERR_OPEN_FAILED : QUIB_ERR_NONE;
}

class Query {
public:
    Query(const char *volume, const __tag_FI_SQL_COND *conditions, const __tag_FI_SQL_COND *folderConditions,
          const std::function<int(const __tag_FI_FILE_INFO_DATA &)> &keep)
        : volume_(AbsolutePath(volume)),
          conditions_(conditions),
          folderConditions_(folderConditions),
          keep_(keep) {}

    int Run() {
        ReadPlan(conditions_, &plan_);
        ReadPlan(folderConditions_, &plan_);
        if (const int code = ReadShares(volume_, &shares_)) {
            return code;
        }
        if (const int code = ReadIndex()) {
            return code;
        }
        decided_ = Direct();
        if (!decided_) {
            if (const int code = PrepareCheck()) {
                return code;
            }
        }
        if (const int err = OpenDirNoFollow(volume_, O_PATH, &volumeFd_)) {
            return VLIBCErrFromErrno(err);
        }
        int64_t previous = -1;
        for (const Candidate &c : candidates_) {
            if (c.folder != previous && fds_.size() > 256) {
                fds_.clear();  // folders come in walk order: their ancestors stay useful a while
            }
            previous = c.folder;
            if (const int code = Look(c.folder, c.name)) {
                return code;
            }
        }
        return Flush();
    }

private:
    // Everything the query needs from the index, read in one go while root.
    int ReadIndex() {
        RootForRead root;
        FileIdxDb db;
        if (const int code = OpenIndex(volume_.c_str(), &db)) {
            return code;
        }
        const ScopeExit done([this] { folderRow_.reset(); });
        if (const int code = Exec(db.get(), "BEGIN")) {
            return code;
        }
        if (const int code = CheckReady(db.get())) {
            return code;
        }
        // Every folder when every name is a candidate; else the key ranges only, and the
        // folders of the candidates with their parents one by one.
        {
            Statement s;
            if (const int code =
                    Prepare(db.get(),
                            plan_.namesKnown ? "SELECT id, 0, '', first, count FROM folders WHERE count > 0"
                                             : "SELECT id, parent, name, first, count FROM folders",
                            &s)) {
                return code;
            }
            int rc;
            while ((rc = sqlite3_step(s.get())) == SQLITE_ROW) {
                const int64_t id = sqlite3_column_int64(s.get(), 0);
                const int64_t count = sqlite3_column_int64(s.get(), 4);
                if (count > 0) {
                    ranges_.push_back({sqlite3_column_int64(s.get(), 3), count, id});
                }
                if (!plan_.namesKnown) {
                    QueryFolder f;
                    f.parent = sqlite3_column_int64(s.get(), 1);
                    f.name.assign(static_cast<const char *>(sqlite3_column_blob(s.get(), 2)),
                                  static_cast<size_t>(sqlite3_column_bytes(s.get(), 2)));
                    folders_.emplace(id, std::move(f));
                }
            }
            if (rc != SQLITE_DONE) {
                return FileIdxCodeOf(db.get(), rc);
            }
            std::sort(ranges_.begin(), ranges_.end());
        }
        if (const int code =
                Prepare(db.get(), "SELECT parent, name FROM folders WHERE id = ?", &folderRow_)) {
            return code;
        }
        Statement names;
        if (const int code = Prepare(db.get(), "SELECT names FROM folders WHERE id = ?", &names)) {
            return code;
        }
        auto namesOf = [&](int64_t id, size_t most, std::vector<std::string> *out) -> int {
            sqlite3_reset(names.get());
            sqlite3_bind_int64(names.get(), 1, id);
            const int rc = sqlite3_step(names.get());
            out->clear();
            if (rc == SQLITE_ROW) {
                *out = SplitNames(sqlite3_column_blob(names.get(), 0), sqlite3_column_bytes(names.get(), 0),
                                  most);
                return QUIB_ERR_NONE;
            }
            return rc == SQLITE_DONE ? QUIB_ERR_NONE : FileIdxCodeOf(db.get(), rc);
        };
        std::vector<std::string> list;
        if (!plan_.namesKnown) {
            std::vector<int64_t> ids;
            for (const auto &[id, f] : folders_) {
                ids.push_back(id);
            }
            std::sort(ids.begin(), ids.end());
            for (const int64_t id : ids) {
                if (!Placed(id).relevant) {
                    continue;
                }
                if (const int code = namesOf(id, SIZE_MAX, &list)) {
                    return code;
                }
                for (std::string &name : list) {
                    if (NameMayMatch(plan_, name)) {
                        candidates_.push_back({id, std::move(name)});
                    }
                }
            }
            return QUIB_ERR_NONE;
        }
        std::vector<int64_t> keys;
        Statement match;
        if (const int code = Prepare(db.get(), "SELECT rowid FROM names WHERE names MATCH ?", &match)) {
            return code;
        }
        for (const std::vector<std::string> &trigrams : plan_.byName) {
            sqlite3_reset(match.get());
            if (const int code = BindText(match.get(), 1, MatchQuery(trigrams))) {
                return code;
            }
            int rc;
            while ((rc = sqlite3_step(match.get())) == SQLITE_ROW) {
                keys.push_back(sqlite3_column_int64(match.get(), 0));
            }
            if (rc != SQLITE_DONE) {
                return FileIdxCodeOf(db.get(), rc);
            }
        }
        std::sort(keys.begin(), keys.end());
        keys.erase(std::unique(keys.begin(), keys.end()), keys.end());
        // Keys of one folder are consecutive: its names are read once, up to the last wanted.
        for (size_t i = 0; i < keys.size();) {
            const Range *r = RangeOf(keys[i]);
            size_t j = i + 1;
            while (j < keys.size() && r != nullptr && keys[j] < r->first + r->count) {
                ++j;
            }
            if (r != nullptr && Load(r->id) && Placed(r->id).relevant) {
                if (const int code = namesOf(r->id, static_cast<size_t>(keys[j - 1] - r->first) + 1, &list)) {
                    return code;
                }
                for (size_t k = i; k < j; ++k) {
                    const auto position = static_cast<size_t>(keys[k] - r->first);
                    if (position < list.size() && NameMayMatch(plan_, list[position])) {
                        candidates_.push_back({r->id, list[position]});
                    }
                }
            }
            i = j;
        }
        return QUIB_ERR_NONE;
    }

    // Reads a folder's place in the tree from the index when it is not known yet.
    bool Load(int64_t id) {
        if (folders_.count(id) != 0) {
            return true;
        }
        sqlite3_reset(folderRow_.get());
        sqlite3_bind_int64(folderRow_.get(), 1, id);
        if (sqlite3_step(folderRow_.get()) != SQLITE_ROW) {
            return false;
        }
        QueryFolder f;
        f.parent = sqlite3_column_int64(folderRow_.get(), 0);
        f.name.assign(static_cast<const char *>(sqlite3_column_blob(folderRow_.get(), 1)),
                      static_cast<size_t>(sqlite3_column_bytes(folderRow_.get(), 1)));
        folders_.emplace(id, std::move(f));
        return true;
    }

    struct Range {
        int64_t first, count, id;
        bool operator<(const Range &o) const { return first < o.first; }
    };
    // The folder whose names a trigram table key stands for; null for none.
    const Range *RangeOf(int64_t key) const {
        auto it = std::upper_bound(ranges_.begin(), ranges_.end(), Range{key, 0, 0});
        if (it == ranges_.begin()) {
            return nullptr;
        }
        --it;
        return key < it->first + it->count ? &*it : nullptr;
    }

    // The folder with its share, share-relative path, and whether the plan lets rows in it.
    const QueryFolder &Placed(int64_t id) {
        QueryFolder &f = folders_.at(id);  // nodes stay put while the map grows
        if (f.share != -2) {
            return f;
        }
        f.share = -1;
        if (id == kRootId) {
            f.reachable = true;
        } else if (f.parent != id && Load(f.parent)) {
            const QueryFolder &parent = Placed(f.parent);
            if (parent.reachable) {
                f.reachable = true;
                f.full = parent.full;
                f.full.push_back(f.name);
            }
        }
        if (!f.reachable) {
            return f;
        }
        // The deepest share that holds the folder.
        size_t depth = 0;
        for (size_t i = 0; i < shares_.size(); ++i) {
            const auto &b = shares_[i].below;
            if (b.size() <= f.full.size() && b.size() > depth &&
                std::equal(b.begin(), b.end(), f.full.begin())) {
                f.share = static_cast<int>(i);
                depth = b.size();
            }
        }
        if (f.share < 0) {
            return f;
        }
        f.path.assign(f.full.begin() + static_cast<long>(depth), f.full.end());
        for (const std::string &c : f.path) {
            f.parentPath += f.parentPath.empty() ? "" : "/";
            f.parentPath += c;
        }
        f.relevant = true;
        for (const auto &alternatives : plan_.pathOr) {
            bool any = false;
            for (const PathPrefix &p : alternatives) {
                any = any || FolderMayMatch(f.path, p);
            }
            f.relevant = f.relevant && any;
        }
        for (const auto &names : plan_.shareOr) {
            f.relevant = f.relevant && names.count(shares_[static_cast<size_t>(f.share)].name) != 0;
        }
        return f;
    }

    // The folder open for reading, reached from the volume one component at a time, as the
    // caller: a folder the caller may enter but not list gives nothing, as it gives a walk.
    int FolderFd(int64_t id) {
        if (id == kRootId) {
            return volumeFd_.Get();
        }
        const auto cached = fds_.find(id);
        if (cached != fds_.end()) {
            return cached->second.Get();
        }
        const QueryFolder &f = folders_.at(id);
        const int parent = FolderFd(f.parent);
        if (parent < 0) {
            return -1;
        }
        FileDescriptor fd(openat(parent, f.name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        const int raw = fd.Get();
        fds_.emplace(id, std::move(fd));
        return raw;
    }

    const std::string &NameOfUid(uid_t uid) {
        auto it = users_.find(uid);
        if (it == users_.end()) {
            NssUser u;
            it = users_.emplace(uid, FindUserById(uid, &u) == NssStatus::kFound ? u.name : std::string())
                     .first;
        }
        return it->second;
    }
    const std::string &NameOfGid(gid_t gid) {
        auto it = groups_.find(gid);
        if (it == groups_.end()) {
            NssGroup g;
            it = groups_.emplace(gid, FindGroupById(gid, &g) == NssStatus::kFound ? g.name : std::string())
                     .first;
        }
        return it->second;
    }

    int Look(int64_t folder, const std::string &name) {
        const QueryFolder &f = folders_.at(folder);
        const int fd = FolderFd(folder);
        struct statx sx;
        if (fd < 0 ||
            statx(fd, name.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS | STATX_BTIME, &sx) != 0) {
            return QUIB_ERR_NONE;  // gone, or out of the caller's reach: a walk would not see it either
        }
        const Share &share = shares_[static_cast<size_t>(f.share)];
        const std::string &parentPath = f.parentPath;
        const size_t pathSize = parentPath.empty() ? name.size() : parentPath.size() + 1 + name.size();
        if (name.size() >= sizeof(FI_FILE_INFO_DATA::name) || pathSize >= sizeof(FI_FILE_INFO_DATA::path) ||
            share.realPath.size() >= sizeof(FI_FILE_INFO_DATA::realPath)) {
            return QUIB_ERR_NONE;  // a record could not hold it; the walk cannot reach it either
        }
        if (used_ == batch_.size()) {
            batch_.emplace_back(std::make_unique<__tag_FI_FILE_INFO_DATA>());
        }
        __tag_FI_FILE_INFO_DATA &r = *batch_[used_++];
        r.type[0] = '\0';
        const bool isDir = S_ISDIR(sx.stx_mode);
        Copy(name, r.name, sizeof r.name);
        Copy(share.realPath, r.realPath, sizeof r.realPath);
        Copy(parentPath, r.parentPath, sizeof r.parentPath);
        Copy(share.name, r.share, sizeof r.share);
        if (parentPath.empty()) {
            Copy(name, r.path, sizeof r.path);
        } else {
            memcpy(r.path, parentPath.data(), parentPath.size());
            r.path[parentPath.size()] = '/';
            Copy(name, r.path + parentPath.size() + 1, sizeof r.path - parentPath.size() - 1);
        }
        r.isDir = isDir ? 1 : 0;
        r.size = isDir ? 0 : static_cast<long long>(sx.stx_size);
        const char *dot = strrchr(r.name, '.');
        if (!isDir && dot != nullptr && dot != r.name) {
            snprintf(r.type, sizeof r.type, "%s", dot + 1);
            for (char *c = r.type; *c != '\0'; ++c) {
                *c = static_cast<char>(*c >= 'A' && *c <= 'Z' ? *c + ('a' - 'A') : *c);
            }
        }
        auto seconds = [](const struct statx_timestamp &t) -> long long {
            return t.tv_sec < INT32_MIN ? INT32_MIN : t.tv_sec > INT32_MAX ? INT32_MAX : t.tv_sec;
        };
        r.crtime = (sx.stx_mask & STATX_BTIME) != 0 ? seconds(sx.stx_btime) : 0;
        r.ctime = seconds(sx.stx_ctime);
        r.atime = seconds(sx.stx_atime);
        r.mtime = seconds(sx.stx_mtime);
        static const char kLetters[] = "rwxrwxrwx";
        for (unsigned i = 0; i < 9; ++i) {
            r.posix[i] = (sx.stx_mode & (0400u >> i)) != 0 ? kLetters[i] : '-';
        }
        r.posix[9] = '\0';
        r.mode = sx.stx_mode;
        r.uid = sx.stx_uid;
        r.gid = sx.stx_gid;
        Copy(NameOfUid(sx.stx_uid), r.userName, sizeof r.userName);
        Copy(NameOfGid(sx.stx_gid), r.groupName, sizeof r.groupName);
        return used_ >= kBatch ? Flush() : QUIB_ERR_NONE;
    }

    // The chains are decided by the SQL of the result databases over the live records, so an
    // index hit means what a stored hit means.
    int PrepareCheck() {
        if (const int code = OpenMemoryFileIdxDb(&check_)) {
            return code;
        }
        SqlText insert;
        insert.text = std::string("INSERT INTO fileinfo(") + kFileIdxColumns +
                      ", rowid) VALUES(?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?)";
        if (const int code = PrepareBound(check_.get(), insert, &insert_)) {
            return code;
        }
        SqlText select;
        select.text = "SELECT rowid FROM fileinfo WHERE ";
        int code = AppendWhere(conditions_, &select);
        select.text += " AND ";
        if (code == QUIB_ERR_NONE) {
            code = AppendWhere(folderConditions_, &select);
        }
        select.text += " ORDER BY rowid";
        return code == QUIB_ERR_NONE ? PrepareBound(check_.get(), select, &select_) : code;
    }

    // Chains of names, paths and shares only are decided here, as the SQL functions decide
    // them; any other chain goes through the SQL of the result databases.
    bool Direct() {
        for (const __tag_FI_SQL_COND *chain : {conditions_, folderConditions_}) {
            std::set<const __tag_FI_SQL_COND *> seen;
            if (chain != nullptr && !Conjuncts(chain, &seen, &direct_)) {
                return false;
            }
        }
        for (const Alternatives &alts : direct_) {
            for (const __tag_FI_SQL_COND *c : alts) {
                const bool ok =
                    (c->type == FI_COND_NAME && (c->op == FI_OP_LIKE || c->op == FI_OP_EQ)) ||
                    (c->type == FI_COND_PATH &&
                     (c->op == FI_OP_PATH_LIKE || c->op == FI_OP_PATH_NOT_LIKE || c->op == FI_OP_EQ)) ||
                    (c->type == FI_COND_SHARE && c->op == FI_OP_EQ);
                if (!ok) {
                    return false;
                }
            }
        }
        return true;
    }

    bool Holds(const __tag_FI_FILE_INFO_DATA &r) const {
        for (const Alternatives &alts : direct_) {
            bool any = false;
            for (size_t i = 0; !any && i < alts.size(); ++i) {
                const __tag_FI_SQL_COND &c = *alts[i];
                const std::string operand = Operand(c);
                const char *field = c.type == FI_COND_NAME   ? r.name
                                    : c.type == FI_COND_PATH ? r.path
                                                             : r.share;
                switch (c.op) {
                    case FI_OP_LIKE:
                        any = VLIBCUnicodeUTF8LikeMatch(operand.c_str(), field, '\\') != 0;
                        break;
                    case FI_OP_PATH_LIKE:
                        any = FileIdxPathLike(operand, field);
                        break;
                    case FI_OP_PATH_NOT_LIKE:
                        any = !FileIdxPathLike(operand, field);
                        break;
                    default:
                        any = operand == field;
                        break;
                }
            }
            if (!any) {
                return false;
            }
        }
        return true;
    }

    int Flush() {
        std::vector<size_t> kept;
        if (decided_) {
            for (size_t i = 0; i < used_; ++i) {
                if (Holds(*batch_[i])) {
                    kept.push_back(i);
                }
            }
        } else if (used_ > 0) {
            int code = Exec(check_.get(), "DELETE FROM fileinfo");
            for (size_t i = 0; code == QUIB_ERR_NONE && i < used_; ++i) {
                code = BindRecord(insert_.get(), *batch_[i]);
                if (code == QUIB_ERR_NONE) {
                    sqlite3_bind_int64(insert_.get(), 19, static_cast<sqlite3_int64>(i) + 1);
                    const int rc = sqlite3_step(insert_.get());
                    code = rc == SQLITE_DONE ? QUIB_ERR_NONE : FileIdxCodeOf(check_.get(), rc);
                }
                sqlite3_reset(insert_.get());
            }
            if (code != QUIB_ERR_NONE) {
                return code;
            }
            int rc;
            while ((rc = sqlite3_step(select_.get())) == SQLITE_ROW) {
                kept.push_back(static_cast<size_t>(sqlite3_column_int64(select_.get(), 0) - 1));
            }
            sqlite3_reset(select_.get());
            if (rc != SQLITE_DONE) {
                return FileIdxCodeOf(check_.get(), rc);
            }
        }
        used_ = 0;
        for (const size_t i : kept) {
            if (const int code = keep_(*batch_[i])) {
                return code;
            }
        }
        return QUIB_ERR_NONE;
    }

    static constexpr size_t kBatch = 256;
    const std::string volume_;
    const __tag_FI_SQL_COND *conditions_;
    const __tag_FI_SQL_COND *folderConditions_;
    const std::function<int(const __tag_FI_FILE_INFO_DATA &)> &keep_;
    Plan plan_;
    std::vector<Share> shares_;
    std::unordered_map<int64_t, QueryFolder> folders_;
    std::vector<Range> ranges_;  // by first key
    struct Candidate {
        int64_t folder;
        std::string name;
    };
    std::vector<Candidate> candidates_;  // in folder and name order
    Statement folderRow_;                // while the index is open
    FileDescriptor volumeFd_;
    std::unordered_map<int64_t, FileDescriptor> fds_;
    std::unordered_map<uid_t, std::string> users_;
    std::unordered_map<gid_t, std::string> groups_;
    std::vector<std::unique_ptr<__tag_FI_FILE_INFO_DATA>> batch_;  // reused; used_ of them hold rows
    size_t used_ = 0;
    std::vector<Alternatives> direct_;  // the chains' conjuncts when decided here, see Direct
    bool decided_ = false;
    FileIdxDb check_;
    Statement insert_;
    Statement select_;
};

// ---- building and keeping up ---------------------------------------------------------------------

struct Known {
    int64_t parent;
    std::string name;
    int64_t dev, ino, ctime, mtime;
    std::map<std::string, int64_t> children;  // sub-folders by name
};

// Writes the index: folders and their names, and keeps an in-memory picture of the folders.
class Writer {
public:
    explicit Writer(sqlite3 *db) : db_(db) {}

    int Prepare() {
        int code =
            platform::Prepare(db_,
                              "INSERT OR REPLACE INTO folders(id, parent, name, dev, ino, ctime, mtime, "
                              "first, count, names) VALUES(?,?,?,?,?,?,?,?,?,?)",
                              &putFolder_);
        if (code == QUIB_ERR_NONE) {
            code = platform::Prepare(db_, "INSERT INTO names(rowid, name) VALUES(?, ?)", &addName_);
        }
        if (code == QUIB_ERR_NONE) {
            code = platform::Prepare(db_, "INSERT INTO names(names, rowid, name) VALUES('delete', ?, ?)",
                                     &delName_);
        }
        if (code == QUIB_ERR_NONE) {
            code = platform::Prepare(db_, "SELECT first, names FROM folders WHERE id = ?", &getNames_);
        }
        if (code == QUIB_ERR_NONE) {
            code = platform::Prepare(db_, "DELETE FROM folders WHERE id = ?", &delFolder_);
        }
        return code;
    }

    int Load() {
        Statement s;
        if (const int code = platform::Prepare(
                db_, "SELECT id, parent, name, dev, ino, ctime, mtime, first + count FROM folders", &s)) {
            return code;
        }
        int rc;
        while ((rc = sqlite3_step(s.get())) == SQLITE_ROW) {
            const int64_t id = sqlite3_column_int64(s.get(), 0);
            Known k;
            k.parent = sqlite3_column_int64(s.get(), 1);
            k.name.assign(static_cast<const char *>(sqlite3_column_blob(s.get(), 2)),
                          static_cast<size_t>(sqlite3_column_bytes(s.get(), 2)));
            k.dev = sqlite3_column_int64(s.get(), 3);
            k.ino = sqlite3_column_int64(s.get(), 4);
            k.ctime = sqlite3_column_int64(s.get(), 5);
            k.mtime = sqlite3_column_int64(s.get(), 6);
            known_[id] = std::move(k);
            nextId_ = std::max(nextId_, id + 1);
            nextKey_ = std::max<int64_t>(nextKey_, sqlite3_column_int64(s.get(), 7));
        }
        if (rc != SQLITE_DONE) {
            return FileIdxCodeOf(db_, rc);
        }
        for (auto &[id, k] : known_) {
            const auto parent = known_.find(k.parent);
            if (id != kRootId && parent != known_.end()) {
                parent->second.children[k.name] = id;
            }
        }
        return QUIB_ERR_NONE;
    }

    // Walks the folder open at fd (id new or known) and everything below that is not known.
    // known: compare with what the index holds and read only what changed.
    int Visit(int64_t id, int64_t parent, const std::string &name, int fd, int depth, bool fullRead) {
        struct stat st;
        if (fstat(fd, &st) != 0) {
            return errno == ENOENT ? QUIB_ERR_NONE : VLIBCErrFromErrno(errno);
        }
        auto it = known_.find(id);
        bool read = fullRead || it == known_.end();
        if (it != known_.end() && (it->second.dev != static_cast<int64_t>(st.st_dev) ||
                                   it->second.ino != static_cast<int64_t>(st.st_ino))) {
            if (const int code = DropChildren(id)) {  // another folder now stands here
                return code;
            }
            read = true;
        } else if (it != known_.end() &&
                   (it->second.ctime != Nanos(st.st_ctim) || it->second.mtime != Nanos(st.st_mtim))) {
            read = true;
        }
        if (onFolder) {
            onFolder(id, fd);
        }
        if (!read) {
            for (const auto &[childName, childId] : std::map<std::string, int64_t>(it->second.children)) {
                FileDescriptor child(
                    openat(fd, childName.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
                if (!child.IsOpen() || depth >= kMaxDepth) {
                    if (const int code = Drop(childId)) {
                        return code;
                    }
                    continue;
                }
                if (const int code = Visit(childId, id, childName, child.Get(), depth + 1, false)) {
                    return code;
                }
            }
            return QUIB_ERR_NONE;
        }
        return Read(id, parent, name, fd, st, depth);
    }

    // Reads the entries of a folder again and the sub-folders they name.
    int Read(int64_t id, int64_t parent, const std::string &name, int fd, const struct stat &st, int depth) {
        ++foldersRead;
        std::vector<Entry> entries;
        if (const int err = ReadEntries(fd, id == kRootId, &entries)) {
            return err == ENOENT ? QUIB_ERR_NONE : VLIBCErrFromErrno(err);
        }
        std::vector<std::string> names;
        for (const Entry &e : entries) {
            names.push_back(e.name);
        }
        if (const int code = DeleteNames(id)) {  // none for a new folder
            return code;
        }
        Known &k = known_[id];
        k.parent = parent;
        k.name = name;
        k.dev = static_cast<int64_t>(st.st_dev);
        k.ino = static_cast<int64_t>(st.st_ino);
        k.ctime = Nanos(st.st_ctim);
        k.mtime = Nanos(st.st_mtim);
        const int64_t first = nextKey_;
        nextKey_ += static_cast<int64_t>(names.size());
        if (const int code = PutFolder(id, k, first, static_cast<int64_t>(names.size()), JoinNames(names))) {
            return code;
        }
        for (size_t i = 0; i < names.size(); ++i) {
            if (const int code = AddName(first + static_cast<int64_t>(i), names[i])) {
                return code;
            }
        }
        // Sub-folders: the known ones that are gone go; the others are visited.
        std::set<std::string> dirs;
        for (const Entry &e : entries) {
            if (e.isDir) {
                dirs.insert(e.name);
            }
        }
        for (const auto &[childName, childId] : std::map<std::string, int64_t>(known_[id].children)) {
            if (dirs.count(childName) == 0) {
                if (const int code = Drop(childId)) {
                    return code;
                }
            }
        }
        if (depth >= kMaxDepth) {
            return QUIB_ERR_NONE;
        }
        for (const std::string &dir : dirs) {
            FileDescriptor child(openat(fd, dir.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
            if (!child.IsOpen()) {
                continue;  // gone or replaced since it was listed
            }
            const auto found = known_[id].children.find(dir);
            int64_t childId;
            if (found != known_[id].children.end()) {
                childId = found->second;
                struct stat cs;
                const Known &c = known_.at(childId);
                if (shallow && fstat(child.Get(), &cs) == 0 && c.dev == static_cast<int64_t>(cs.st_dev) &&
                    c.ino == static_cast<int64_t>(cs.st_ino)) {
                    continue;  // the same folder: its own reports say when it changes
                }
            } else {
                childId = nextId_++;
                known_[id].children[dir] = childId;
            }
            if (const int code = Visit(childId, id, dir, child.Get(), depth + 1, false)) {
                return code;
            }
        }
        return QUIB_ERR_NONE;
    }

    // Forgets a folder and everything below it.
    int Drop(int64_t id) {
        if (const int code = DropChildren(id)) {
            return code;
        }
        const auto it = known_.find(id);
        if (it == known_.end()) {
            return QUIB_ERR_NONE;
        }
        if (const int code = DeleteNames(id)) {
            return code;
        }
        sqlite3_reset(delFolder_.get());
        sqlite3_bind_int64(delFolder_.get(), 1, id);
        if (const int code = RunToEnd(delFolder_.get())) {
            return code;
        }
        const auto parent = known_.find(it->second.parent);
        if (parent != known_.end()) {
            parent->second.children.erase(it->second.name);
        }
        if (onDrop) {
            onDrop(id);
        }
        known_.erase(it);
        return QUIB_ERR_NONE;
    }

    int DropChildren(int64_t id) {
        const auto it = known_.find(id);
        if (it == known_.end()) {
            return QUIB_ERR_NONE;
        }
        for (const auto &[n, childId] : std::map<std::string, int64_t>(it->second.children)) {
            (void)n;
            if (const int code = Drop(childId)) {
                return code;
            }
        }
        return QUIB_ERR_NONE;
    }

    bool IsKnown(int64_t id) const { return known_.count(id) != 0; }
    const Known &KnownOf(int64_t id) const { return known_.at(id); }

    std::function<void(int64_t, int)> onFolder;
    std::function<void(int64_t)> onDrop;
    unsigned long long foldersRead = 0;
    bool shallow = false;  // Read leaves known sub-folders that are still the same alone

private:
    int PutFolder(int64_t id, const Known &k, int64_t first, int64_t count, const std::string &names) {
        sqlite3_stmt *s = putFolder_.get();
        sqlite3_reset(s);
        sqlite3_bind_int64(s, 1, id);
        sqlite3_bind_int64(s, 2, k.parent);
        sqlite3_bind_blob(s, 3, k.name.data(), static_cast<int>(k.name.size()), SQLITE_STATIC);
        sqlite3_bind_int64(s, 4, k.dev);
        sqlite3_bind_int64(s, 5, k.ino);
        sqlite3_bind_int64(s, 6, k.ctime);
        sqlite3_bind_int64(s, 7, k.mtime);
        sqlite3_bind_int64(s, 8, first);
        sqlite3_bind_int64(s, 9, count);
        sqlite3_bind_blob(s, 10, names.data(), static_cast<int>(names.size()), SQLITE_STATIC);
        return RunToEnd(s);
    }

    int AddName(int64_t key, const std::string &name) {
        const std::string text = IndexText(name);
        sqlite3_reset(addName_.get());
        sqlite3_bind_int64(addName_.get(), 1, key);
        sqlite3_bind_text(addName_.get(), 2, text.data(), static_cast<int>(text.size()), SQLITE_STATIC);
        return RunToEnd(addName_.get());
    }

    // A contentless table forgets a row only when told the text it indexed.
    int DeleteNames(int64_t id) {
        sqlite3_reset(getNames_.get());
        sqlite3_bind_int64(getNames_.get(), 1, id);
        const int rc = sqlite3_step(getNames_.get());
        if (rc == SQLITE_DONE) {
            return QUIB_ERR_NONE;
        }
        if (rc != SQLITE_ROW) {
            return FileIdxCodeOf(db_, rc);
        }
        const int64_t first = sqlite3_column_int64(getNames_.get(), 0);
        const std::vector<std::string> names =
            SplitNames(sqlite3_column_blob(getNames_.get(), 1), sqlite3_column_bytes(getNames_.get(), 1));
        sqlite3_reset(getNames_.get());
        for (size_t i = 0; i < names.size(); ++i) {
            const std::string text = IndexText(names[i]);
            sqlite3_reset(delName_.get());
            sqlite3_bind_int64(delName_.get(), 1, first + static_cast<int64_t>(i));
            sqlite3_bind_text(delName_.get(), 2, text.data(), static_cast<int>(text.size()), SQLITE_STATIC);
            if (const int code = RunToEnd(delName_.get())) {
                return code;
            }
        }
        return QUIB_ERR_NONE;
    }

    sqlite3 *db_;
    Statement putFolder_, addName_, delName_, getNames_, delFolder_;
    std::unordered_map<int64_t, Known> known_;
    int64_t nextId_ = kRootId + 1;
    int64_t nextKey_ = 1;  // the trigram table's next free key
};

int SetMeta(sqlite3 *db, const char *key, const std::string &value) {
    Statement s;
    if (const int code = Prepare(db, "INSERT OR REPLACE INTO meta(key, value) VALUES(?, ?)", &s)) {
        return code;
    }
    sqlite3_bind_text(s.get(), 1, key, -1, SQLITE_STATIC);
    sqlite3_bind_text(s.get(), 2, value.c_str(), -1, SQLITE_STATIC);
    return RunToEnd(s.get());
}

std::string Now() {
    return std::to_string(static_cast<long long>(time(nullptr)));
}

// Takes (waiting) or gives back the writers' lock: an open file description lock, so that
// status can look at it without taking it.
int Lock(int fd, short type) {
    struct flock lock = {};
    lock.l_type = type;
    return fcntl(fd, F_OFD_SETLKW, &lock);
}

// The index's folder, made root's 0700, and its lock, held exclusively by a writer.
struct Upkeep {
    FileDescriptor dir;
    FileDescriptor lock;
    FileDescriptor volume;
    std::string dirPath;
    std::string volumePath;
};

int BeginUpkeep(const char *volume, Upkeep *u) {
    if (const int err = CheckPathArgument(volume)) {
        return VLIBCErrFromErrno(err);
    }
    if (geteuid() != 0) {
        return QUIB_ERR_ACCESS_DENIED;
    }
    u->volumePath = AbsolutePath(volume);
    if (const int err = OpenDirNoFollow(u->volumePath, O_RDONLY, &u->volume)) {
        return err == ELOOP || err == ENOTDIR ? QUIB_ERR_ACCESS_DENIED : VLIBCErrFromErrno(err);
    }
    u->dirPath = u->volumePath + "/" + kIndexDir;
    if (const int code = OpenPrivateDir(u->dirPath, true, &u->dir)) {
        return code;
    }
    u->lock.Reset(openat(u->dir.Get(), kLockName, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!u->lock.IsOpen()) {
        return VLIBCErrFromErrno(errno);
    }
    return Lock(u->lock.Get(), F_WRLCK) == 0 ? QUIB_ERR_NONE : VLIBCErrFromErrno(errno);
}

int OpenForWrite(const std::string &path, FileIdxDb *db) {
    sqlite3 *raw = nullptr;
    const int rc = sqlite3_open_v2(path.c_str(), &raw, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOFOLLOW, nullptr);
    db->reset(raw);
    if (rc != SQLITE_OK) {
        return FileIdxCodeOf(raw, rc);
    }
    sqlite3_busy_timeout(raw, kBusyTimeoutMs);
    return QUIB_ERR_NONE;
}

int BuildLocked(Upkeep &u) {
    for (const char *suffix : {"", "-journal", "-wal", "-shm"}) {
        unlinkat(u.dir.Get(), (std::string(kScratchName) + suffix).c_str(), 0);
    }
    {
        FileDescriptor file(
            openat(u.dir.Get(), kScratchName, O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
        if (!file.IsOpen()) {
            return VLIBCErrFromErrno(errno);
        }
    }
    ScopeExit remove([&] {
        for (const char *suffix : {"", "-journal"}) {
            unlinkat(u.dir.Get(), (std::string(kScratchName) + suffix).c_str(), 0);
        }
    });
    const std::string scratch = u.dirPath + "/" + kScratchName;
    {
        FileIdxDb db;
        int code = OpenForWrite(scratch, &db);
        if (code == QUIB_ERR_NONE) {
            code = Exec(db.get(), "PRAGMA journal_mode=OFF; PRAGMA synchronous=OFF; BEGIN;");
        }
        if (code == QUIB_ERR_NONE) {
            code = Exec(db.get(), kIndexSchema);
        }
        {
            Writer writer(db.get());
            if (code == QUIB_ERR_NONE) {
                code = writer.Prepare();
            }
            if (code == QUIB_ERR_NONE) {
                code = writer.Visit(kRootId, 0, "", u.volume.Get(), 0, true);
            }
        }
        const std::string now = Now();
        if (code == QUIB_ERR_NONE) {
            code = SetMeta(db.get(), "built", now);
        }
        if (code == QUIB_ERR_NONE) {
            code = SetMeta(db.get(), "updated", now);
        }
        if (code == QUIB_ERR_NONE) {
            code = SetMeta(db.get(), "version", kVersion);
        }
        if (code == QUIB_ERR_NONE) {
            // One merged trigram index, the pages it left behind given back.
            code = Exec(
                db.get(),
                "COMMIT; INSERT INTO names(names) VALUES('optimize'); VACUUM; PRAGMA journal_mode=DELETE;");
        }
        if (code == QUIB_ERR_NONE) {
            code = CodeOfSqlite(sqlite3_close(db.release()));
        }
        if (code != QUIB_ERR_NONE) {
            return code;
        }
    }
    {
        FileDescriptor file(openat(u.dir.Get(), kScratchName, O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
        if (!file.IsOpen() || fsync(file.Get()) != 0) {
            return VLIBCErrFromErrno(errno);
        }
    }
    if (renameat(u.dir.Get(), kScratchName, u.dir.Get(), kIndexName) != 0) {
        return VLIBCErrFromErrno(errno);
    }
    remove.Dismiss();
    fsync(u.dir.Get());
    return QUIB_ERR_NONE;
}

int OpenForUpkeep(Upkeep &u, FileIdxDb *db) {
    const std::string path = u.dirPath + "/" + kIndexName;
    int code = OpenFileIdxDb(path.c_str(), DbOwner::kRoot, db);
    if (code == QUIB_ERR_NONE) {
        code = CheckReady(db->get());
    }
    return code;
}

int UpdateLocked(Upkeep &u, sqlite3 *db, Writer *writer) {
    int code = Exec(db, "BEGIN IMMEDIATE");
    if (code == QUIB_ERR_NONE) {
        code = writer->Visit(kRootId, 0, "", u.volume.Get(), 0, false);
    }
    if (code == QUIB_ERR_NONE) {
        code = SetMeta(db, "updated", Now());
    }
    if (code == QUIB_ERR_NONE) {
        code = Exec(db, "COMMIT");
    }
    if (code != QUIB_ERR_NONE) {
        sqlite3_exec(db, "ROLLBACK", nullptr, nullptr, nullptr);
    }
    return code;
}

}  // namespace

std::string IndexText(const std::string &name) {
    std::string out;
    const uint8_t *t = reinterpret_cast<const uint8_t *>(name.c_str());
    while (*t != 0) {
        UChar32 c;
        t = Decode(t, &c);
        out += IndexChar(c);
    }
    return out;
}

std::vector<std::string> NameTrigrams(const std::string &pattern, bool like) {
    std::set<std::string> trigrams;
    if (!like) {
        AddTrigrams(IndexText(pattern), &trigrams);
        return {trigrams.begin(), trigrams.end()};
    }
    // The pattern read as the matcher reads it: a run of literals that fold to ASCII matches
    // as many consecutive characters of the name, whose index text is the same run.
    std::string run;
    const uint8_t *p = reinterpret_cast<const uint8_t *>(pattern.c_str());
    while (*p != 0) {
        UChar32 c;
        p = Decode(p, &c);
        if (c == '*' || c == '?') {
            AddTrigrams(run, &trigrams);
            run.clear();
            continue;
        }
        if (c == '\\') {
            if (*p == 0) {
                break;
            }
            p = Decode(p, &c);
        }
        const UChar32 folded =
            c < 0x80 ? (c >= 'A' && c <= 'Z' ? c + ('a' - 'A') : c) : u_foldCase(c, U_FOLD_CASE_DEFAULT);
        if (folded > 0 && folded < 0x80) {
            run += static_cast<char>(folded);
        } else {
            AddTrigrams(run, &trigrams);
            run.clear();
        }
    }
    AddTrigrams(run, &trigrams);
    return {trigrams.begin(), trigrams.end()};
}

bool VolumeIndexUsable(const char *volume) {
    RootForRead root;
    FileIdxDb db;
    return OpenIndex(volume, &db) == QUIB_ERR_NONE && CheckReady(db.get()) == QUIB_ERR_NONE;
}

int QueryVolumeIndex(const char *volume, const __tag_FI_SQL_COND *conditions,
                     const __tag_FI_SQL_COND *folderConditions,
                     const std::function<int(const __tag_FI_FILE_INFO_DATA &)> &keep) {
    if (const int err = CheckPathArgument(volume)) {
        return VLIBCErrFromErrno(err);
    }
    return Query(volume, conditions, folderConditions, keep).Run();
}

int BuildVolumeIndex(const char *volume) {
    Upkeep u;
    if (const int code = BeginUpkeep(volume, &u)) {
        return code;
    }
    return BuildLocked(u);
}

int UpdateVolumeIndex(const char *volume, unsigned long long *foldersRead) {
    Upkeep u;
    if (const int code = BeginUpkeep(volume, &u)) {
        return code;
    }
    FileIdxDb db;
    if (OpenForUpkeep(u, &db) != QUIB_ERR_NONE) {
        db.reset();
        if (const int code = BuildLocked(u)) {
            return code;
        }
        if (foldersRead != nullptr) {
            *foldersRead = 0;
        }
        return QUIB_ERR_NONE;
    }
    Writer writer(db.get());
    int code = writer.Prepare();
    if (code == QUIB_ERR_NONE) {
        code = writer.Load();
    }
    if (code == QUIB_ERR_NONE) {
        code = UpdateLocked(u, db.get(), &writer);
    }
    if (code == QUIB_ERR_NONE && foldersRead != nullptr) {
        *foldersRead = writer.foldersRead;
    }
    return code;
}

int VolumeIndexStatus(const char *volume, FI_INDEX_STATUS *status) {
    if (const int err = CheckPathArgument(volume)) {
        return VLIBCErrFromErrno(err);
    }
    *status = FI_INDEX_STATUS{};
    RootForRead root;
    FileDescriptor dir;
    const int opened = OpenPrivateDir(IndexDirOf(volume), false, &dir);
    if (opened == QUIB_ERR_NO_SUCH_FILE) {
        return QUIB_ERR_NONE;
    }
    if (opened != QUIB_ERR_NONE) {
        return opened;
    }
    FileDescriptor lock(openat(dir.Get(), kLockName, O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    struct flock probe = {};
    probe.l_type = F_WRLCK;
    if (lock.IsOpen() && fcntl(lock.Get(), F_OFD_GETLK, &probe) == 0 && probe.l_type != F_UNLCK) {
        status->building = 1;
    }
    struct stat st;
    if (fstatat(dir.Get(), kIndexName, &st, AT_SYMLINK_NOFOLLOW) != 0) {
        return QUIB_ERR_NONE;
    }
    status->bytes = static_cast<unsigned long long>(st.st_size);
    status->state = FI_INDEX_DAMAGED;
    FileIdxDb db;
    if (OpenIndex(volume, &db) != QUIB_ERR_NONE || CheckReady(db.get()) != QUIB_ERR_NONE) {
        return QUIB_ERR_NONE;
    }
    Statement s;
    if (Prepare(db.get(), "SELECT count(*), total(count) FROM folders", &s) != QUIB_ERR_NONE ||
        sqlite3_step(s.get()) != SQLITE_ROW) {
        return QUIB_ERR_NONE;
    }
    const auto folders = static_cast<unsigned long long>(sqlite3_column_int64(s.get(), 0));
    const auto entries = static_cast<unsigned long long>(sqlite3_column_double(s.get(), 1));
    Statement m;
    if (Prepare(db.get(), "SELECT key, value FROM meta", &m) == QUIB_ERR_NONE) {
        while (sqlite3_step(m.get()) == SQLITE_ROW) {
            const char *key = reinterpret_cast<const char *>(sqlite3_column_text(m.get(), 0));
            const long long value = sqlite3_column_int64(m.get(), 1);
            if (key != nullptr && strcmp(key, "built") == 0) {
                status->built = value;
            } else if (key != nullptr && strcmp(key, "updated") == 0) {
                status->updated = value;
            }
        }
    }
    status->folders = folders;
    status->entries = entries;
    status->state = FI_INDEX_READY;
    return QUIB_ERR_NONE;
}

namespace {

// The kernel's change reports, applied as whole re-reads of the folders they name.
class Watcher {
public:
    Watcher(Upkeep &u, const volatile int *stop) : u_(u), stop_(stop) {}

    int Run() {
        inotify_.Reset(inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
        if (!inotify_.IsOpen()) {
            return VLIBCErrFromErrno(errno);
        }
        if (const int code = Open()) {
            return code;
        }
        int code = UpdateLocked(u_, db_.get(), writer_.get());  // what changed before the watches
        Lock(u_.lock.Get(), F_UNLCK);
        using Clock = std::chrono::steady_clock;
        Clock::time_point firstDirty{}, lastEvent{}, lastFull = Clock::now();
        while (code == QUIB_ERR_NONE && *stop_ == 0) {
            struct pollfd p = {inotify_.Get(), POLLIN, 0};
            const int ready = poll(&p, 1, 100);
            if (ready < 0 && errno != EINTR) {
                return VLIBCErrFromErrno(errno);
            }
            const Clock::time_point now = Clock::now();
            if (ready > 0 && ReadEvents()) {
                lastEvent = now;
                if (firstDirty == Clock::time_point{}) {
                    firstDirty = now;
                }
            }
            if (limited_ && now - lastFull >= std::chrono::seconds(1)) {
                full_ = true;  // no watch for some folders: look at every folder each second
            }
            const bool settled = now - lastEvent >= std::chrono::milliseconds(50) ||
                                 now - firstDirty >= std::chrono::milliseconds(300);
            if (full_ || (!dirty_.empty() && settled)) {
                if (full_) {
                    lastFull = now;
                }
                code = Apply();
                firstDirty = Clock::time_point{};
            }
        }
        return code;
    }

private:
    int Open() {
        writer_.reset();
        db_.reset();
        int code = OpenForUpkeep(u_, &db_);
        if (code != QUIB_ERR_NONE) {
            db_.reset();
            if ((code = BuildLocked(u_)) != QUIB_ERR_NONE ||
                (code = OpenForUpkeep(u_, &db_)) != QUIB_ERR_NONE) {
                return code;
            }
        }
        struct stat st;
        if (fstatat(u_.dir.Get(), kIndexName, &st, AT_SYMLINK_NOFOLLOW) != 0) {
            return VLIBCErrFromErrno(errno);
        }
        ino_ = st.st_ino;
        writer_ = std::make_unique<Writer>(db_.get());
        writer_->onFolder = [this](int64_t id, int fd) { AddWatch(id, fd); };
        writer_->onDrop = [this](int64_t id) { dirty_.erase(id); };
        wds_.clear();
        if ((code = writer_->Prepare()) != QUIB_ERR_NONE) {
            return code;
        }
        return writer_->Load();
    }

    void AddWatch(int64_t id, int fd) {
        if (limited_) {
            return;
        }
        const std::string path = "/proc/self/fd/" + std::to_string(fd);
        const int wd = inotify_add_watch(
            inotify_.Get(), path.c_str(),
            IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO | IN_ONLYDIR | IN_EXCL_UNLINK);
        if (wd >= 0) {
            wds_[wd] = id;
        } else if (errno == ENOSPC) {
            limited_ = true;
        }
    }

    // true when something is to be done.
    bool ReadEvents() {
        alignas(struct inotify_event) char buffer[16384];
        bool any = false;
        for (;;) {
            const ssize_t n = read(inotify_.Get(), buffer, sizeof buffer);
            if (n <= 0) {
                return any;
            }
            for (ssize_t at = 0; at < n;) {
                const auto *e = reinterpret_cast<const struct inotify_event *>(buffer + at);
                at += static_cast<ssize_t>(sizeof *e + e->len);
                if ((e->mask & IN_Q_OVERFLOW) != 0) {
                    full_ = any = true;
                } else if ((e->mask & IN_IGNORED) != 0) {
                    wds_.erase(e->wd);
                } else if (const auto it = wds_.find(e->wd); it != wds_.end()) {
                    dirty_.insert(it->second);
                    any = true;
                }
            }
        }
    }

    // The folder open for reading, reached from the volume by the names the index holds.
    int OpenFolder(int64_t id, FileDescriptor *fd, int *depth) {
        std::vector<std::string> names;
        for (int64_t at = id; at != kRootId; at = writer_->KnownOf(at).parent) {
            if (!writer_->IsKnown(at)) {
                return ENOENT;
            }
            names.push_back(writer_->KnownOf(at).name);
        }
        *depth = static_cast<int>(names.size());
        FileDescriptor dir(openat(u_.volume.Get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        for (auto it = names.rbegin(); it != names.rend() && dir.IsOpen(); ++it) {
            dir.Reset(openat(dir.Get(), it->c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        }
        if (!dir.IsOpen()) {
            return errno;
        }
        *fd = std::move(dir);
        return 0;
    }

    int Apply() {
        if (Lock(u_.lock.Get(), F_WRLCK) != 0) {
            return VLIBCErrFromErrno(errno);
        }
        const ScopeExit unlock([this] { Lock(u_.lock.Get(), F_UNLCK); });
        struct stat st;
        if (fstatat(u_.dir.Get(), kIndexName, &st, AT_SYMLINK_NOFOLLOW) != 0 || st.st_ino != ino_) {
            if (const int code = Open()) {  // built anew meanwhile
                return code;
            }
            full_ = true;
        }
        if (full_) {
            full_ = false;
            dirty_.clear();
            return UpdateLocked(u_, db_.get(), writer_.get());
        }
        int code = Exec(db_.get(), "BEGIN IMMEDIATE");
        const std::set<int64_t> dirty = std::move(dirty_);
        dirty_.clear();
        for (const int64_t id : dirty) {
            if (code != QUIB_ERR_NONE || !writer_->IsKnown(id)) {
                continue;  // dropped with a folder above it
            }
            FileDescriptor fd;
            int depth = 0;
            if (OpenFolder(id, &fd, &depth) != 0) {
                continue;  // gone: its parent's report drops it
            }
            struct stat folder;
            if (fstat(fd.Get(), &folder) != 0) {
                continue;
            }
            const Known &k = writer_->KnownOf(id);
            writer_->shallow = true;
            code = writer_->Read(id, k.parent, std::string(k.name), fd.Get(), folder, depth);
            writer_->shallow = false;
        }
        if (code == QUIB_ERR_NONE) {
            code = SetMeta(db_.get(), "updated", Now());
        }
        if (code == QUIB_ERR_NONE) {
            code = Exec(db_.get(), "COMMIT");
        }
        if (code != QUIB_ERR_NONE) {
            sqlite3_exec(db_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
        }
        return code;
    }

    Upkeep &u_;
    const volatile int *stop_;
    FileDescriptor inotify_;
    FileIdxDb db_;
    std::unique_ptr<Writer> writer_;
    ino_t ino_ = 0;
    std::unordered_map<int, int64_t> wds_;
    std::set<int64_t> dirty_;
    bool full_ = false;
    bool limited_ = false;
};

}  // namespace

int WatchVolumeIndex(const char *volume, const volatile int *stop) {
    Upkeep u;
    if (const int code = BeginUpkeep(volume, &u)) {
        return code;
    }
    return Watcher(u, stop).Run();
}

}  // namespace norvo::platform
