// NvoDirectoryWalker. A walk is a loop over an explicit stack of open directories, so depth
// costs heap, not the caller's stack. Each directory is opened relative to its parent with
// O_NOFOLLOW and its entries are read whole before any is visited; entries are stat'ed relative
// to its descriptor, so neither a path longer than PATH_MAX nor a folder swapped for a link
// between the stat and the open can lead the walk elsewhere. Only the deepest kOpenLevels
// directories stay open; a shallower one is found again through ".." of its child and checked
// to be the same directory.
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <vector>

#include "common/beneath.h"
#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/norvodir.h"
#include "quib_fs.h"
#include "quib_share.h"
#include "quib_stat.h"
#include "vlibc_err.h"

namespace {

using norvo::OwnedFd;

constexpr size_t kOpenLevels = 48;
constexpr size_t kReadBuffer = 64 * 1024;

// The source lines the log lines carry, which differ by order.
struct LogLines {
    int chdir;
    int open;
    int stat;
};
constexpr LogLines kWalkLines{724, 733, 756};
constexpr LogLines kTopDownLines{658, 667, 691};
constexpr LogLines kFirstFolderLines{585, 594, 618};

bool Passes(_enum_ignore_err_ mode, int err) {
    return mode == IGNORE_ERR_ALL || (mode == IGNORE_ERR_PERMISSION && (err == EACCES || err == EPERM));
}

// One directory being read: its names (NUL-separated, in reader order), the next one to visit,
// and the lengths the walk's two path strings have while it is the current directory.
struct Level {
    OwnedFd dir;    // not open while the level is parked deep above the current one
    dev_t dev = 0;  // the directory's identity, taken when it is parked
    ino_t ino = 0;
    std::string names;
    size_t next = 0;
    size_t realLength = 0;
    size_t userLength = 0;
    QUIBSTAT entry{};  // the stat of the entry that led here, for the post callback
};

// Reads all names of the directory open at fd into level->names. 0 or the errno.
int ReadNames(int fd, Level *level) {
    std::unique_ptr<char[]> buffer(new char[kReadBuffer]);
    for (;;) {
        const ssize_t got = getdents64(fd, buffer.get(), kReadBuffer);
        if (got < 0) {
            return errno;
        }
        if (got == 0) {
            return 0;
        }
        level->names.reserve(level->names.size() + static_cast<size_t>(got));  // names never outgrow records
        for (ssize_t at = 0; at < got;) {
            const auto *entry = reinterpret_cast<const struct dirent64 *>(buffer.get() + at);
            level->names.append(entry->d_name, strlen(entry->d_name) + 1);
            at += entry->d_reclen;
        }
    }
}

enum class Failed { kNone, kChdir, kOpen };

// Enters a directory as the text's chdir + opendir would, on a descriptor opened by openDir
// (flags in, descriptor out): the access test of chdir is fchdir on what was opened, so the
// directory checked is the directory read. Fills level's descriptor, identity and names.
template <typename OpenDir>
Failed Enter(OpenDir &&openDir, Level *level, int *err) {
    level->dir = openDir(O_RDONLY | O_DIRECTORY);
    if (!level->dir.IsOpen()) {
        *err = errno;
        // Unreadable, or not reachable at all? chdir needs only the right to search.
        OwnedFd reachable = openDir(O_PATH | O_DIRECTORY);
        if (!reachable.IsOpen()) {
            *err = errno;
            return Failed::kChdir;
        }
        if (fchdir(reachable.Get()) != 0) {
            *err = errno;
            return Failed::kChdir;
        }
        return Failed::kOpen;
    }
    if (fchdir(level->dir.Get()) != 0) {
        *err = errno;
        return Failed::kChdir;
    }
    if ((*err = ReadNames(level->dir.Get(), level)) != 0) {
        return Failed::kOpen;
    }
    return Failed::kNone;
}

// The callbacks of one order: pre before each entry, post after it (and its subtree).
struct Visit {
    NvoDirectoryWalkerCallBack *pre;
    NvoDirectoryWalkerCallBack *post;
    LogLines lines;
    bool skipRecycle;
};

class Walk {
public:
    Walk(_enum_ignore_err_ mode, const int *cancel, const std::string &basePath, const std::string *extra)
        : mode_(mode), cancel_(cancel), basePath_(basePath), extra_(extra) {}

    // Walks the directory at realDir (opened by openDir). With firstFolders, that directory
    // alone: the names of its folders whose callback said true are added there, not entered.
    template <typename OpenDir>
    bool Run(const std::string &userDir, const std::string &realDir, OpenDir &&openDir, const Visit &visit,
             std::vector<std::string> *firstFolders = nullptr) {
        real_ = realDir;
        user_ = userDir;
        levels_.clear();
        int passed = 0;
        if (!Push(openDir, visit, &passed)) {
            return passed != 0;
        }
        while (!levels_.empty()) {
            Level &level = *levels_.back();
            if (level.next >= level.names.size()) {
                if (!Pop(visit)) {
                    return false;
                }
                continue;
            }
            if (Cancelled()) {
                level.next = level.names.size();
                continue;
            }
            const char *name = level.names.c_str() + level.next;
            const size_t length = strlen(name);
            level.next += length + 1;
            if (QUIBEAIsHiddenFile(name) != 0) {
                continue;
            }
            real_.resize(level.realLength);
            user_.resize(level.userLength);
            real_.push_back('/');
            real_.append(name, length);
            user_.push_back('/');
            user_.append(name, length);
            if (visit.skipRecycle && QUIBShareIsShareRecycle(real_.c_str()) == 1) {
                continue;
            }
            QUIBSTAT st{};
            if (VLIBCFileLStatAt(level.dir.Get(), name, QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st) != 0) {
                const int err = errno;
                if (Passes(mode_, err)) {
                    continue;
                }
                NVO_LOG_AT(norvo::kNorvoDir, visit.lines.stat, "%s:%d VLIBCFileLStat: (%s), %s, quiberr=%x.",
                           real_.c_str(), strerror(err), VLIBCErrGet());
                return false;
            }
            entry_.assign(name, length);  // reused: no allocation per entry
            const std::string &entryName = entry_;
            if (visit.pre != nullptr && !(*visit.pre)(user_, basePath_, real_, entryName, st, extra_)) {
                return false;
            }
            if (S_ISDIR(st.st_mode)) {
                if (firstFolders != nullptr) {
                    firstFolders->push_back(entryName);
                    continue;
                }
                const int parent = level.dir.Get();
                auto openChild = [parent, &entryName](int flags) {
                    return OwnedFd(openat(parent, entryName.c_str(), flags | O_NOFOLLOW | O_CLOEXEC));
                };
                int passedChild = 0;
                if (Push(openChild, visit, &passedChild)) {
                    levels_.back()->entry = st;
                    continue;
                }
                if (passedChild == 0) {
                    return false;
                }
            }
            if (visit.post != nullptr && !(*visit.post)(user_, basePath_, real_, entryName, st, extra_)) {
                return false;
            }
        }
        return true;
    }

private:
    bool Cancelled() const { return cancel_ != nullptr && __atomic_load_n(cancel_, __ATOMIC_RELAXED) == 1; }

    // Opens the directory the path strings name now and makes it the current level. false when
    // it can't be entered; *passed then says whether the failure is passed over (else logged).
    template <typename OpenDir>
    bool Push(OpenDir &&openDir, const Visit &visit, int *passed) {
        auto level = std::make_unique<Level>();
        int err = 0;
        const Failed failed = Enter(openDir, level.get(), &err);
        if (failed != Failed::kNone) {
            *passed = Passes(mode_, err) ? 1 : 0;
            if (*passed == 0 && failed == Failed::kChdir) {
                NVO_LOG_AT(norvo::kNorvoDir, visit.lines.chdir, "%s:%d Failed to chdir %s. [%s]",
                           real_.c_str(), strerror(err));
            } else if (*passed == 0) {
                NVO_LOG_AT(norvo::kNorvoDir, visit.lines.open, "%s:%d Failed to open %s, error %s",
                           real_.c_str(), strerror(err));
            }
            return false;
        }
        level->realLength = real_.size();
        level->userLength = user_.size();
        levels_.push_back(std::move(level));
        if (levels_.size() > kOpenLevels) {
            Park(levels_[levels_.size() - kOpenLevels - 1].get());
        }
        return true;
    }

    // Closes a shallow level's descriptor, keeping what tells the directory again on the way up.
    // Should even fstat fail, the identity left zero matches nothing, and the way up fails safe.
    static void Park(Level *level) {
        struct stat st;
        if (fstat(level->dir.Get(), &st) == 0) {
            level->dev = st.st_dev;
            level->ino = st.st_ino;
        }
        level->dir.Reset();
    }

    // Leaves the current level: reopens its parent if parked, then calls post for the entry
    // that led into it.
    bool Pop(const Visit &visit) {
        std::unique_ptr<Level> done = std::move(levels_.back());
        levels_.pop_back();
        if (levels_.empty()) {
            return true;
        }
        Level &parent = *levels_.back();
        real_.resize(done->realLength);
        user_.resize(done->userLength);
        if (!parent.dir.IsOpen() && !Unpark(*done, &parent, visit)) {
            return false;
        }
        if (visit.post == nullptr) {
            return true;
        }
        const size_t nameStart = parent.realLength + 1;
        const std::string name = real_.substr(nameStart);
        return (*visit.post)(user_, basePath_, real_, name, done->entry, extra_);
    }

    // The parent of child through child's "..": the same directory as before, or the rest of it
    // is lost (it moved away under the walk), which counts as failing to open it.
    bool Unpark(const Level &child, Level *parent, const Visit &visit) {
        parent->dir = OwnedFd(openat(child.dir.Get(), "..", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        int err = errno;
        struct stat st;
        if (parent->dir.IsOpen()) {
            err = fstat(parent->dir.Get(), &st) != 0                       ? errno
                  : (st.st_dev != parent->dev || st.st_ino != parent->ino) ? ESTALE
                                                                           : 0;
        }
        if (err == 0) {
            return true;
        }
        const std::string parentPath = real_.substr(0, parent->realLength);
        parent->next = parent->names.size();
        if (Passes(mode_, err)) {
            return true;
        }
        NVO_LOG_AT(norvo::kNorvoDir, visit.lines.open, "%s:%d Failed to open %s, error %s",
                   parentPath.c_str(), strerror(err));
        return false;
    }

    const _enum_ignore_err_ mode_;
    const int *const cancel_;
    const std::string &basePath_;
    const std::string *const extra_;
    std::string real_;
    std::string user_;
    std::string entry_;  // the name of the entry being visited
    std::vector<std::unique_ptr<Level>> levels_;
};

// Opens the starting directory. Below a user path's share (or home) folder no component may
// be a link; a caller that gives no user path for realDir vouches for realDir as it is.
auto OpenStart(const std::string &userDir, const std::string &realDir) {
    std::string top;
    const bool beneath = norvo::TopOf(userDir, realDir, &top);
    return [beneath, top, &realDir](int flags) {
        return beneath ? norvo::OpenBeneath(top, realDir, flags)
                       : OwnedFd(open(realDir.c_str(), flags | O_CLOEXEC));
    };
}

bool BadStart(const std::string &realDir, const LogLines &lines) {
    if (!realDir.empty() && realDir[0] == '/') {
        return false;
    }
    NVO_LOG_AT(norvo::kNorvoDir, lines.chdir, "%s:%d Bad parameter");
    return true;
}

}  // namespace

NvoDirectoryWalkerCallBack::~NvoDirectoryWalkerCallBack() = default;

NvoDirectoryWalker::NvoDirectoryWalker(_enum_ignore_err_ mode, int *cancel) : mode_(mode), cancel_(cancel) {}

bool NvoDirectoryWalker::Walk(const std::string &userDir, const std::string &basePath,
                              const std::string &realDir, NvoDirectoryWalkerCallBack *pre,
                              NvoDirectoryWalkerCallBack *post, const std::string *extra, bool skipRecycle) {
    return norvo::Guarded(false, [&] {
        if (BadStart(realDir, kWalkLines)) {
            return false;
        }
        ::Walk walk(mode_, cancel_, basePath, extra);
        return walk.Run(userDir, realDir, OpenStart(userDir, realDir),
                        Visit{pre, post, kWalkLines, skipRecycle});
    });
}

bool NvoDirectoryWalker::Walk_TopDown(const std::string &userDir, const std::string &basePath,
                                      const std::string &realDir, NvoDirectoryWalkerCallBack &cb,
                                      const std::string *extra, bool skipRecycle) {
    return norvo::Guarded(false, [&] {
        if (BadStart(realDir, kTopDownLines)) {
            return false;
        }
        ::Walk walk(mode_, cancel_, basePath, extra);
        return walk.Run(userDir, realDir, OpenStart(userDir, realDir),
                        Visit{&cb, nullptr, kTopDownLines, skipRecycle});
    });
}

bool NvoDirectoryWalker::Walk_FirstFolder_First(const std::string &userDir, const std::string &basePath,
                                                const std::string &realDir, NvoDirectoryWalkerCallBack &cb,
                                                const std::string *extra, bool skipRecycle,
                                                bool firstFolderOnly) {
    return norvo::Guarded(false, [&] {
        if (BadStart(realDir, kFirstFolderLines)) {
            return false;
        }
        // The first folder stays open while its sub-folders are walked, each opened in it.
        OwnedFd first;
        auto openStart = OpenStart(userDir, realDir);
        auto openFirst = [&](int flags) {
            OwnedFd fd = openStart(flags);
            if (fd.IsOpen() && (flags & O_PATH) == 0) {
                first = OwnedFd(fcntl(fd.Get(), F_DUPFD_CLOEXEC, 0));
                if (!first.IsOpen()) {
                    return OwnedFd();
                }
            }
            return fd;
        };
        std::vector<std::string> folders;
        ::Walk walk(mode_, cancel_, basePath, extra);
        if (!walk.Run(userDir, realDir, openFirst, Visit{&cb, nullptr, kFirstFolderLines, skipRecycle},
                      &folders)) {
            return false;
        }
        if (firstFolderOnly) {
            return true;
        }
        for (const std::string &name : folders) {
            auto openChild = [&first, &name](int flags) {
                return OwnedFd(openat(first.Get(), name.c_str(), flags | O_NOFOLLOW | O_CLOEXEC));
            };
            if (!walk.Run(userDir + "/" + name, realDir + "/" + name, openChild,
                          Visit{&cb, nullptr, kTopDownLines, false})) {
                return false;
            }
        }
        return true;
    });
}
