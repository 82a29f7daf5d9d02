#include "extra_mounts.h"

#include <fcntl.h>
#include <mntent.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <memory>

#include "fail.h"
#include "fs_util.h"
#include "private_root.h"
#include "unique_fd.h"

namespace norvo::testing::internal {

namespace {

constexpr long kMountTimeoutMilliseconds = 10000;
constexpr off_t kFatImageBytes = 64 << 20;

// A FUSE server mounts asynchronously: wait until the kernel lists the mount, or the server
// has given up.
void WaitForMount(ChildProcess &server, const std::string &path, const std::string &type,
                  const char *program) {
    for (long waited = 0; waited < kMountTimeoutMilliseconds; waited += 5) {
        if (MountTypeAt(path) == type)
            return;
        int status = 0;
        if (server.Ended(&status)) {
            Fail("%s gave up mounting %s (%s %d)", program, path.c_str(),
                 WIFSIGNALED(status) ? "signal" : "status",
                 WIFSIGNALED(status) ? WTERMSIG(status) : WEXITSTATUS(status));
        }
        timespec delay{0, 5000000L};
        nanosleep(&delay, nullptr);
    }
    Fail("%s did not mount %s within %ld ms", program, path.c_str(), kMountTimeoutMilliseconds);
}

bool IsMountPoint(const std::string &path) {
    return !MountTypeAt(path).empty();
}

}  // namespace

std::string MountTypeAt(const std::string &path) {
    const std::unique_ptr<FILE, int (*)(FILE *)> table(setmntent("/proc/self/mounts", "re"), endmntent);
    if (!table)
        FailErrno("can't read /proc/self/mounts");
    std::string type;
    mntent entry{};
    char buffer[4096];
    while (getmntent_r(table.get(), &entry, buffer, sizeof buffer) != nullptr)
        if (path == entry.mnt_dir)
            type = entry.mnt_type;
    return type;
}

void MountVolume(const std::string &path) {
    if (path.empty() || path[0] != '/')
        Fail("a volume needs an absolute path, not \"%s\"", path.c_str());
    MountTmpfs(path, "0755");
}

void RemountReadOnly(const std::string &path) {
    struct stat st {};
    if (stat(path.c_str(), &st) != 0)
        FailErrno("can't make %s read-only", path.c_str());
    if (!IsMountPoint(path) && mount(path.c_str(), path.c_str(), nullptr, MS_BIND, nullptr) != 0)
        FailErrno("can't bind %s onto itself", path.c_str());
    // A bind remount changes only this mount's flag, whatever the file system.
    if (mount(nullptr, path.c_str(), nullptr, MS_REMOUNT | MS_BIND | MS_RDONLY, nullptr) != 0)
        FailErrno("can't remount %s read-only", path.c_str());
}

ChildProcess MountFat(const std::string &path) {
    const std::string mkfs = FindProgram("mkfs.vfat");
    const std::string fusefat = FindProgram("fusefat");
    if (mkfs.empty())
        Fail("MountFat needs mkfs.vfat (package dosfstools)");
    if (fusefat.empty())
        Fail("MountFat needs fusefat (package fusefat)");
    static int images = 0;
    const std::string image = std::string(kStateDir) + "/fat" + std::to_string(++images) + ".img";
    {
        const UniqueFd fd(open(image.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
        if (!fd || ftruncate(fd.get(), kFatImageBytes) != 0)
            FailErrno("can't create %s", image.c_str());
    }
    RunProgram({mkfs, image});
    MakeDirectory(path, 0, 0, 0755);
    // fusefat traces every call on stdout and stderr; its failure shows as its exit status.
    ChildProcess server = ChildProcess::Start({fusefat, "-f", "-o", "rw+,allow_other", image, path}, true);
    WaitForMount(server, path, "fuse.fusefat", "fusefat");
    return server;
}

ChildProcess MountDeadRemote(const std::string &path) {
    MakeDirectory(path, 0, 0, 0755);
    ChildProcess server = ChildProcess::Start({NORVO_DEADREMOTE_BIN, "-f", "-o", "allow_other", path});
    WaitForMount(server, path, "fuse.norvo-deadremote", "norvo-deadremote");
    return server;
}

}  // namespace norvo::testing::internal
