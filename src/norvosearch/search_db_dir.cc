// A task's identity and folders: ids, paths, and the folders made for them.
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <memory>

#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/nvoman.h"
#include "norvo/searchdb.h"
#include "norvosearch/search_db_record.h"
#include "quib_user.h"
#include "vlibc_err.h"

using norvo::kNorvoSearch;
using namespace norvo::search;

namespace {

constexpr char kSearchRoot[] = "@tmp/norvo/FBSearch";
constexpr int kErrDiskFull = 0x2500;

// Closes a descriptor when it goes out of scope.
class Fd {
public:
    explicit Fd(int fd = -1) : fd_(fd) {}
    ~Fd() {
        if (fd_ >= 0) {
            close(fd_);
        }
    }
    Fd(const Fd &) = delete;
    Fd &operator=(const Fd &) = delete;
    int get() const { return fd_; }

private:
    int fd_;
};

bool BadParameter() {
    NVO_SET_QUIB_ERR(kNorvoSearch, QUIB_ERR_BAD_PARAMETER);
    NVO_LOG(kNorvoSearch, "%s:%d Bad Parameter");
    return false;
}

// Opens name in parent as a directory without following a link, making it (0700 until
// finished through its own descriptor) when missing. It must end up owned by uid, with mode;
// an existing one of root's is handed over when we may, one of anybody else's is refused
// (EPERM): in a folder others can write, it may have been planted. 0 or the errno.
int OpenOwnedDir(int parent, const char *name, uid_t uid, gid_t gid, mode_t mode, int *out) {
    const bool made = mkdirat(parent, name, 0700) == 0;
    if (!made && errno != EEXIST) {
        return errno;
    }
    Fd dir(openat(parent, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    struct stat st;
    int err = 0;
    if (dir.get() < 0 || fstat(dir.get(), &st) != 0) {
        err = errno;
    } else if (st.st_uid != uid && !(made || st.st_uid == 0)) {
        return EPERM;
    } else if ((st.st_uid != uid && fchown(dir.get(), uid, gid) != 0) ||
               ((st.st_mode & 07777) != mode && fchmod(dir.get(), mode) != 0) ||
               (*out = dup(dir.get())) < 0) {
        err = errno;
    }
    // Left behind, a half-made folder would stand in for the real one from then on; rmdir
    // takes only an empty one, so nothing swapped in is lost.
    if (err != 0 && made) {
        unlinkat(parent, name, AT_REMOVEDIR);
    }
    return err;
}

// The temporary folders NvoCreateTmpDir made: root's directories, reached without a link, and
// given the sticky bit when we may, so that nobody can rename the search root away.
int OpenTmpDir(int parent, const char *name, int *out) {
    Fd dir(openat(parent, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    struct stat st;
    if (dir.get() < 0 || fstat(dir.get(), &st) != 0) {
        return errno;
    }
    if (st.st_uid != 0) {
        return EPERM;
    }
    if ((st.st_mode & S_ISVTX) == 0 && geteuid() == 0 &&
        fchmod(dir.get(), (st.st_mode & 07777) | S_ISVTX) != 0) {
        return errno;
    }
    *out = dup(dir.get());
    return *out < 0 ? errno : 0;
}

// Makes the search root and the user's task folder. 0 or the errno; *where names the folder.
int MakeTaskFolders(const char *volume, const char *user, std::string *where) {
    uid_t uid = 0;
    gid_t gid = 0;
    *where = std::string(volume) + "/" + kSearchRoot + "/" + user;
    if (QUIBUserGetUGID(user, &uid, &gid) != 0) {
        return ENOENT;
    }
    Fd vol(open(volume, O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (vol.get() < 0) {
        *where = volume;
        return errno;
    }
    int raw = -1;
    *where = std::string(volume) + "/@tmp";
    int err = OpenTmpDir(vol.get(), "@tmp", &raw);
    Fd tmp(raw);
    if (err == 0) {
        *where += "/norvo";
        err = OpenTmpDir(tmp.get(), "norvo", &raw);
    }
    Fd norvo(err == 0 ? raw : -1);
    if (err == 0) {
        *where += "/FBSearch";
        err = OpenOwnedDir(norvo.get(), "FBSearch", 0, 0, 01777, &raw);
    }
    Fd root(err == 0 ? raw : -1);
    if (err == 0) {
        *where = *where + "/" + user;
        err = OpenOwnedDir(root.get(), user, uid, gid, 0700, &raw);
    }
    Fd mine(err == 0 ? raw : -1);
    return err;
}

// A per-process mix of the process id and a count of draws: XORed into the random part, it
// keeps two draws apart, in this process and beside any other running one, when no random
// device is there and random() was seeded with the same second.
unsigned int DrawSalt() {
    static unsigned int draws = 0;
    return static_cast<unsigned int>(getpid()) * 0x9E3779B1u + (draws++) * 0x85EBCA77u;
}

}  // namespace

std::string NvoSearchDBTask::getDBTaskDir(const char *volume, const char *user) {
    return norvo::Guarded(std::string(), [&] {
        char buffer[4096] = {0};
        snprintf(buffer, sizeof buffer, "%s/%s/%s", volume != nullptr ? volume : "", kSearchRoot,
                 user != nullptr ? user : "");
        return std::string(buffer);
    });
}

std::string NvoSearchDBTask::getDBTaskFilePath(const char *volume, const char *user, const char *taskId) {
    return norvo::Guarded(std::string(), [&] {
        char buffer[4096] = {0};
        snprintf(buffer, sizeof buffer, "%s/%s", getDBTaskDir(volume, user).c_str(),
                 taskId != nullptr ? taskId : "");
        return std::string(buffer);
    });
}

bool NvoSearchDBTask::checkDBTaskDirExists(const char *volume, const char *user) {
    return norvo::Guarded(false, [&] {
        return IsVolume(volume) && IsUserComponent(user) &&
               access(getDBTaskDir(volume, user).c_str(), F_OK) == 0;
    });
}

bool NvoSearchDBTask::checkDBTaskExists(const char *volume, const char *user, const char *taskId) {
    return norvo::Guarded(false, [&] {
        return IsVolume(volume) && IsUserComponent(user) && IsTaskId(taskId) &&
               access(getDBTaskFilePath(volume, user, taskId).c_str(), F_OK) == 0;
    });
}

int NvoSearchDBTask::GetRandom() {
    int fd = open("/dev/urandom", O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        fd = open("/dev/random", O_RDONLY | O_CLOEXEC);
    }
    if (fd < 0) {
        srandom(static_cast<unsigned int>(time(nullptr)));
        return static_cast<int>(random());
    }
    int value = 0;
    if (read(fd, &value, sizeof value) < 0) {
        srandom(static_cast<unsigned int>(time(nullptr)));
        value = static_cast<int>(random());
    }
    close(fd);
    return value;
}

std::string NvoSearchDBTask::getUniqueID(const char *volume, const char *user) {
    return norvo::Guarded(std::string(), [&] {
        if (!IsVolume(volume) || !IsUserComponent(user)) {
            BadParameter();
            return std::string();
        }
        char id[1024];
        do {
            snprintf(id, sizeof id, "%X%X", static_cast<unsigned int>(time(nullptr)),
                     static_cast<unsigned int>(GetRandom()) ^ DrawSalt());
        } while (checkDBTaskExists(volume, user, id));
        return std::string(id);
    });
}

bool NvoSearchDBTask::createDBTaskDir(const char *volume, const char *owner, const char *id) {
    return norvo::Guarded(false, [&] {
        if (!IsVolume(volume) || !IsUserComponent(owner) || (id != nullptr && !IsTaskId(id))) {
            return BadParameter();
        }
        const uid_t saved = geteuid();
        // Only root may make the search root and hand the user a folder of their own; without
        // root (a process that really is the user) the folders are made as the caller.
        const bool switched = saved != 0 && seteuid(0) == 0;
        struct Restore {
            bool on;
            uid_t uid;
            ~Restore() {
                if (on && seteuid(uid) != 0) {
                    abort();  // carrying on as root would be worse than ending
                }
            }
        } restore{switched, saved};
        if (NvoCreateTmpDir(volume) != 0) {
            const int err = errno;
            NVO_SET_QUIB_ERR(kNorvoSearch, err == ENOSPC ? kErrDiskFull : QUIB_ERR_FAILED);
            NVO_LOG(kNorvoSearch, "%s(%d): failed to create tmp folder %s/%s/%s, errno=%s(%d)", volume,
                    "@tmp", "norvo", strerror(err), err);
            return false;
        }
        std::string where;
        if (const int err = MakeTaskFolders(volume, owner, &where)) {
            NVO_SET_QUIB_ERR(kNorvoSearch, err == ENOSPC ? kErrDiskFull : QUIB_ERR_FAILED);
            NVO_LOG(kNorvoSearch, "%s(%d): failed to create task folder %s, errno=%s(%d)", where.c_str(),
                    strerror(err), err);
            return false;
        }
        return true;
    });
}

NvoSearchDBTask::NvoSearchDBTask(const char *volume, const char *owner, const char *id) {
    norvo::GuardedVoid([&] {
        if (!IsVolume(volume) || !IsUserComponent(owner) || (id != nullptr && !IsTaskId(id))) {
            BadParameter();
            return;
        }
        user = owner;
        taskId = id != nullptr ? std::string(id) : getUniqueID(volume, owner);
        if (!checkDBTaskExists(volume, owner, taskId.c_str())) {
            createDBTaskDir(volume, owner, taskId.c_str());
        }
        dbPath = getDBTaskFilePath(volume, owner, taskId.c_str());
    });
}

const std::string &NvoSearchDBTask::getDBTaskId() const {
    return taskId;
}

const std::string &NvoSearchDBTask::getDBTaskFilePath() const {
    return dbPath;
}

bool NvoSearchDBTask::remove() {
    return norvo::Guarded(false, [&] {
        if (dbPath.empty()) {
            return false;
        }
        // The companions SQLite leaves after a crash would otherwise stay behind for good.
        unlink((dbPath + "-wal").c_str());
        unlink((dbPath + "-shm").c_str());
        return unlink(dbPath.c_str()) == 0;
    });
}

NvoSearchDBTaskMgr::NvoSearchDBTaskMgr(const char *owner) {
    norvo::GuardedVoid([&] { user = owner != nullptr ? owner : ""; });
}

bool NvoSearchDBTaskMgr::hasDBTask(const char *volume, const char *taskId) const {
    return NvoSearchDBTask::checkDBTaskExists(volume, user.c_str(), taskId);
}

NvoSearchDBTask *NvoSearchDBTaskMgr::getDBTask(const char *volume, const char *taskId) const {
    return norvo::Guarded<NvoSearchDBTask *>(nullptr, [&]() -> NvoSearchDBTask * {
        if (!hasDBTask(volume, taskId)) {
            return nullptr;
        }
        return new NvoSearchDBTask(volume, user.c_str(), taskId);
    });
}

NvoSearchDBTask *NvoSearchDBTaskMgr::createDBTask(const char *volume, const char *taskId) {
    return norvo::Guarded<NvoSearchDBTask *>(nullptr, [&]() -> NvoSearchDBTask * {
        std::unique_ptr<NvoSearchDBTask> task(new NvoSearchDBTask(volume, user.c_str(), taskId));
        return task->getDBTaskFilePath().empty() ? nullptr : task.release();
    });
}

std::string NvoSearchDBTaskMgr::getDBTaskDir(const char *volume) const {
    return NvoSearchDBTask::getDBTaskDir(volume, user.c_str());
}
