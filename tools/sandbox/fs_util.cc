#include "fs_util.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "fail.h"
#include "unique_fd.h"

namespace norvo::testing::internal {

namespace {

void SetOwnerAndMode(int fd, const std::string &path, uid_t uid, gid_t gid, mode_t mode) {
    struct stat st {};
    if (fstat(fd, &st) != 0)
        FailErrno("can't examine %s", path.c_str());
    if ((st.st_uid != uid || st.st_gid != gid) && fchown(fd, uid, gid) != 0)
        FailErrno("can't give %s to %u:%u", path.c_str(), unsigned(uid), unsigned(gid));
    if ((st.st_mode & 07777) != mode && fchmod(fd, mode) != 0)
        FailErrno("can't set mode %04o on %s", unsigned(mode), path.c_str());
}

}  // namespace

void MakeParents(const std::string &path) {
    for (size_t slash = path.find('/', 1); slash != std::string::npos; slash = path.find('/', slash + 1)) {
        const std::string parent = path.substr(0, slash);
        if (mkdir(parent.c_str(), 0755) == 0) {
            if (chmod(parent.c_str(), 0755) != 0)
                FailErrno("can't set the mode of %s", parent.c_str());
        } else if (errno != EEXIST) {
            FailErrno("can't create %s", parent.c_str());
        }
    }
}

void MakeDirectory(const std::string &path, uid_t uid, gid_t gid, mode_t mode) {
    MakeParents(path);
    if (mkdir(path.c_str(), 0700) != 0 && errno != EEXIST)
        FailErrno("can't create %s", path.c_str());
    const UniqueFd fd(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!fd)
        FailErrno("can't open the directory %s", path.c_str());
    SetOwnerAndMode(fd.get(), path, uid, gid, mode);
}

void WriteWholeFile(const std::string &path, const std::string &content, uid_t uid, gid_t gid, mode_t mode) {
    MakeParents(path);
    const UniqueFd fd(open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
    if (!fd)
        FailErrno("can't create %s", path.c_str());
    for (size_t done = 0; done < content.size();) {
        const ssize_t n = write(fd.get(), content.data() + done, content.size() - done);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0)
            FailErrno("can't write %s", path.c_str());
        done += size_t(n);
    }
    SetOwnerAndMode(fd.get(), path, uid, gid, mode);
}

bool ReadWholeFile(const std::string &path, std::string *content) {
    const UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (!fd)
        return false;
    content->clear();
    char buffer[65536];
    for (;;) {
        const ssize_t n = read(fd.get(), buffer, sizeof buffer);
        if (n < 0 && errno == EINTR)
            continue;
        if (n < 0)
            return false;
        if (n == 0)
            return true;
        content->append(buffer, size_t(n));
    }
}

}  // namespace norvo::testing::internal
