// The volume index's upkeep: a build walks the volume into a scratch file; an update and the
// watch read again only the folders that changed, and keep an in-memory picture of the folders.
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

#include <algorithm>
#include <chrono>
#include <map>
#include <memory>
#include <set>
#include <unordered_map>

#include "api_guard.h"
#include "fs_path.h"
#include "private_dir.h"
#include "vlibc_err.h"
#include "volume_index.h"

namespace norvo::platform {
namespace {

constexpr char kIndexSchema[] =
    "CREATE TABLE meta(key TEXT PRIMARY KEY, value) WITHOUT ROWID;"
    "CREATE TABLE folders(id INTEGER PRIMARY KEY, parent INTEGER NOT NULL, name BLOB NOT NULL, "
    "dev INTEGER NOT NULL, ino INTEGER NOT NULL, ctime INTEGER NOT NULL, mtime INTEGER NOT NULL, "
    "first INTEGER NOT NULL, count INTEGER NOT NULL, names BLOB NOT NULL);"
    "CREATE VIRTUAL TABLE names USING fts5(name, content='', detail='none', columnsize=0, "
    "tokenize='trigram case_sensitive 1');";

int64_t Nanos(const struct timespec &t) {
    return static_cast<int64_t>(t.tv_sec) * 1000000000 + t.tv_nsec;
}

// Opens an absolute or relative directory path from "/" (or ".") without following a link.

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
