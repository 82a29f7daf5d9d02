// The volume index: one row per folder (its place, its identity and times, and the names in it
// as one blob) and a contentless FTS5 trigram table over the names. A folder's names have the
// consecutive keys first .. first + count - 1 in the trigram table, new ones each time the folder
// is read: dense keys keep the trigram lists' deltas small. A query takes candidates by name and folder from
// it and looks at each candidate live, so what it returns is what a walk would find now, less what the index
// has not seen.
#include "volume_index.h"

#include <errno.h>
#include <fcntl.h>
#include <stdint.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <unicode/uchar.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <map>
#include <memory>
#include <set>
#include <unordered_map>

#include "api_guard.h"
#include "fileidx_sql.h"
#include "fs_path.h"
#include "like_decode.h"
#include "locked_file.h"
#include "nss.h"
#include "private_dir.h"
#include "quib_share.h"
#include "vlibc_err.h"
#include "vlibc_unicode.h"

namespace norvo::platform {
namespace {

// ---- names and trigrams ----------------------------------------------------------------------

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

// Text into a record's field, cut to fit, always terminated.
void Copy(const std::string &text, char *field, size_t size) {
    const size_t n = std::min(text.size(), size - 1);
    memcpy(field, text.data(), n);
    field[n] = '\0';
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
            const char *value = alts[i]->value;
            const size_t size = strnlen(value, sizeof alts[i]->value);
            if (alts[i]->op != FI_OP_LIKE) {
                any = name.compare(0, std::string::npos, value, size) == 0;
            } else if (size < sizeof alts[i]->value) {  // terminated: matched in place
                any = VLIBCUnicodeUTF8LikeMatch(value, name.c_str(), '\\') != 0;
            } else {
                any = VLIBCUnicodeUTF8LikeMatch(Operand(*alts[i]).c_str(), name.c_str(), '\\') != 0;
            }
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

}  // namespace

// Calls visit(position, name) for each of the first most names of a folder's list (see
// SplitNames); name is one buffer, rewritten for each.
template <typename Visit>
void VisitNames(const void *blob, int size, size_t most, Visit &&visit) {
    const char *p = static_cast<const char *>(blob);
    const char *end = p + (size > 0 ? size : 0);
    std::string name;
    for (size_t position = 0; p < end && position < most; ++position) {
        const size_t shared = std::min(static_cast<size_t>(static_cast<unsigned char>(*p++)), name.size());
        const char *nul = static_cast<const char *>(memchr(p, '\0', static_cast<size_t>(end - p)));
        const char *stop = nul == nullptr ? end : nul;
        name.resize(shared);
        name.append(p, stop);
        visit(position, static_cast<const std::string &>(name));
        p = stop + 1;
    }
}

namespace {

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
        // Calls visit(position, name) for the first most names of folder id.
        auto namesOf = [&](int64_t id, size_t most, auto &&visit) -> int {
            sqlite3_reset(names.get());
            sqlite3_bind_int64(names.get(), 1, id);
            const int rc = sqlite3_step(names.get());
            if (rc == SQLITE_ROW) {
                VisitNames(sqlite3_column_blob(names.get(), 0), sqlite3_column_bytes(names.get(), 0), most,
                           visit);
                return QUIB_ERR_NONE;
            }
            return rc == SQLITE_DONE ? QUIB_ERR_NONE : FileIdxCodeOf(db.get(), rc);
        };
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
                const int code = namesOf(id, SIZE_MAX, [&](size_t, const std::string &name) {
                    if (NameMayMatch(plan_, name)) {
                        candidates_.push_back({id, name});
                    }
                });
                if (code != QUIB_ERR_NONE) {
                    return code;
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
                size_t k = i;  // the next wanted key
                const int code =
                    namesOf(r->id, static_cast<size_t>(keys[j - 1] - r->first) + 1,
                            [&](size_t position, const std::string &name) {
                                if (k < j && static_cast<size_t>(keys[k] - r->first) == position) {
                                    ++k;
                                    if (NameMayMatch(plan_, name)) {
                                        candidates_.push_back({r->id, name});
                                    }
                                }
                            });
                if (code != QUIB_ERR_NONE) {
                    return code;
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
            operands_.emplace_back();
            for (const __tag_FI_SQL_COND *c : alts) {
                const std::string text = Operand(*c);
                operands_.back().push_back({text, c->type == FI_COND_PATH && c->op != FI_OP_EQ
                                                      ? std::make_unique<FileIdxPathPattern>(text)
                                                      : nullptr});
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

    bool Holds(const __tag_FI_FILE_INFO_DATA &r) {
        for (size_t k = 0; k < direct_.size(); ++k) {
            const Alternatives &alts = direct_[k];
            bool any = false;
            for (size_t i = 0; !any && i < alts.size(); ++i) {
                const __tag_FI_SQL_COND &c = *alts[i];
                DirectOperand &o = operands_[k][i];
                const std::string &operand = o.text;
                const char *field = c.type == FI_COND_NAME   ? r.name
                                    : c.type == FI_COND_PATH ? r.path
                                                             : r.share;
                switch (c.op) {
                    case FI_OP_LIKE:
                        any = VLIBCUnicodeUTF8LikeMatch(operand.c_str(), field, '\\') != 0;
                        break;
                    case FI_OP_PATH_LIKE:
                        any = o.path->Matches(field);
                        break;
                    case FI_OP_PATH_NOT_LIKE:
                        any = !o.path->Matches(field);
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

    static constexpr size_t kBatch = 32;
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
    struct DirectOperand {
        std::string text;
        std::unique_ptr<FileIdxPathPattern> path;  // split once, for the path patterns
    };
    std::vector<std::vector<DirectOperand>> operands_;  // of direct_'s records, read once
    bool decided_ = false;
    FileIdxDb check_;
    Statement insert_;
    Statement select_;
};

}  // namespace

// A folder's names, sorted, front-coded: for each, one byte of the length it shares with the
// one before (names are at most 255 bytes), the rest of it, and a NUL.
std::vector<std::string> SplitNames(const void *blob, int size, size_t most) {
    std::vector<std::string> names;
    VisitNames(blob, size, most, [&](size_t, const std::string &name) { names.push_back(name); });
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

std::string IndexText(const std::string &name) {
    std::string out;
    const uint8_t *t = reinterpret_cast<const uint8_t *>(name.c_str());
    while (*t != 0) {
        UChar32 c;
        t = DecodeLikeChar(t, &c);
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
        p = DecodeLikeChar(p, &c);
        if (c == '*' || c == '?') {
            AddTrigrams(run, &trigrams);
            run.clear();
            continue;
        }
        if (c == '\\') {
            if (*p == 0) {
                break;
            }
            p = DecodeLikeChar(p, &c);
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

}  // namespace norvo::platform
