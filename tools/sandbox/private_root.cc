#include "private_root.h"

#include <dirent.h>
#include <fcntl.h>
#include <glob.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "fail.h"
#include "fs_util.h"
#include "unique_fd.h"

namespace norvo::testing::internal {

namespace {

// The host directory the new root is mounted over: only a mount point, its content is hidden
// in the namespace and untouched on the host.
constexpr const char kNewRoot[] = "/mnt";

void Mount(const char *source, const std::string &target, const char *type, unsigned long flags,
           const char *data) {
    if (mount(source, target.c_str(), type, flags, data) != 0)
        FailErrno("can't mount %s on %s (%s)", source != nullptr ? source : "-", target.c_str(),
                  type != nullptr ? type : "bind");
}

void MakeDir(const std::string &path, mode_t mode) {
    if (mkdir(path.c_str(), mode) != 0 && errno != EEXIST)
        FailErrno("can't create %s", path.c_str());
    if (chmod(path.c_str(), mode) != 0)
        FailErrno("can't set the mode of %s", path.c_str());
}

// A bind mount needs a target of the same kind: an empty file for a file or a device node.
void MakeEmptyFile(const std::string &path) {
    const UniqueFd fd(open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
    if (!fd)
        FailErrno("can't create %s", path.c_str());
}

void BindInto(const std::string &hostPath, const std::string &target) {
    struct stat st {};
    if (lstat(hostPath.c_str(), &st) != 0)
        return;
    if (S_ISDIR(st.st_mode)) {
        MakeDir(target, st.st_mode & 07777);
    } else {
        MakeEmptyFile(target);
    }
    Mount(hostPath.c_str(), target, nullptr, MS_BIND | MS_REC, nullptr);
}

void CopySymlink(const std::string &hostPath, const std::string &target) {
    char link[PATH_MAX];
    const ssize_t n = readlink(hostPath.c_str(), link, sizeof link - 1);
    if (n < 0)
        FailErrno("can't read the link %s", hostPath.c_str());
    link[n] = '\0';
    if (symlink(link, target.c_str()) != 0)
        FailErrno("can't create the link %s", target.c_str());
}

// Recursively: mount_setattr reaches the mounts below path, which a bind remount would not.
void MakeReadOnly(const std::string &path) {
    mount_attr attr{};
    attr.attr_set = MOUNT_ATTR_RDONLY;
    if (mount_setattr(AT_FDCWD, path.c_str(), AT_RECURSIVE, &attr, sizeof attr) != 0)
        FailErrno("can't make %s read-only", path.c_str());
}

// The host's directory seen through an overlay whose upper layer is on the private root, so
// the appliance can add and replace files without the host seeing it.
void MountOverlay(const std::string &hostPath, const std::string &newRoot) {
    const std::string name = hostPath.substr(1);
    const std::string state = newRoot + kStateDir + "/" + name;
    MakeDir(state, 0700);
    MakeDir(state + "/upper", 0755);
    MakeDir(state + "/work", 0700);
    struct stat st {};
    if (stat(hostPath.c_str(), &st) != 0)
        FailErrno("can't examine %s", hostPath.c_str());
    // The merged directory shows the upper layer's mode and owner: a private /tmp stays 1777.
    if (chmod((state + "/upper").c_str(), st.st_mode & 07777) != 0 ||
        chown((state + "/upper").c_str(), st.st_uid, st.st_gid) != 0)
        FailErrno("can't prepare the overlay of %s", hostPath.c_str());
    MakeDir(newRoot + hostPath, st.st_mode & 07777);
    const std::string options =
        "lowerdir=" + hostPath + ",upperdir=" + state + "/upper,workdir=" + state + "/work";
    Mount("overlay", newRoot + hostPath, "overlay", 0, options.c_str());
}

// /dev with only what programs under test, mkfs and FUSE need; /dev/log is added by the
// syslog capture.
void BuildDev(const std::string &dev) {
    MakeDir(dev, 0755);
    Mount("tmpfs", dev, "tmpfs", MS_NOSUID, "mode=0755");
    for (const char *node :
         {"null", "zero", "full", "random", "urandom", "tty", "fuse", "ptmx", "loop-control"}) {
        BindInto(std::string("/dev/") + node, dev + "/" + node);
    }
    glob_t loops{};
    if (glob("/dev/loop[0-9]*", 0, nullptr, &loops) == 0) {
        for (size_t i = 0; i < loops.gl_pathc; ++i) {
            const std::string host = loops.gl_pathv[i];
            BindInto(host, dev + host.substr(4));
        }
    }
    globfree(&loops);
    BindInto("/dev/pts", dev + "/pts");
    MountTmpfs(dev + "/shm", "1777");
    for (const auto &[name, target] :
         {std::pair{"fd", "/proc/self/fd"}, std::pair{"stdin", "/proc/self/fd/0"},
          std::pair{"stdout", "/proc/self/fd/1"}, std::pair{"stderr", "/proc/self/fd/2"}}) {
        if (symlink(target, (dev + "/" + name).c_str()) != 0)
            FailErrno("can't create /dev/%s", name);
    }
}

// A host tree kept reachable: its real path, and the directory opened before the new root
// hides the host's paths.
struct ReachableTree {
    std::string path;
    UniqueFd fd;
};

std::vector<ReachableTree> OpenReachableTrees(const std::vector<std::string> &paths) {
    std::vector<ReachableTree> trees;
    for (const std::string &path : paths) {
        const std::unique_ptr<char, void (*)(void *)> real(realpath(path.c_str(), nullptr), free);
        if (!real || std::string(real.get()) == "/")
            continue;  // a tree moved away stays out
        ReachableTree tree{real.get(), UniqueFd(open(real.get(), O_PATH | O_DIRECTORY | O_CLOEXEC))};
        if (!tree.fd)
            FailErrno("can't open %s", real.get());
        trees.push_back(std::move(tree));
    }
    // A tree inside another one comes with it.
    std::sort(trees.begin(), trees.end(),
              [](const auto &a, const auto &b) { return a.path.size() < b.path.size(); });
    std::vector<ReachableTree> outermost;
    for (ReachableTree &tree : trees) {
        const auto inside = [&tree](const ReachableTree &outer) {
            return tree.path == outer.path || tree.path.rfind(outer.path + "/", 0) == 0;
        };
        if (std::none_of(outermost.begin(), outermost.end(), inside))
            outermost.push_back(std::move(tree));
    }
    return outermost;
}

// Binds the host's tree, writable, at its own path under newRoot, and lets every user reach it:
// a directory on the way that others can't search (a home such as /root, 0700) is covered by a
// tmpfs holding only the way on, so the rest of it stays out of reach, root's included.
void MountReachable(const std::string &newRoot, const ReachableTree &tree) {
    for (size_t slash = tree.path.find('/', 1);; slash = tree.path.find('/', slash + 1)) {
        const std::string target = newRoot + tree.path.substr(0, slash);
        struct stat st {};
        if (lstat(target.c_str(), &st) != 0) {
            MakeDir(target, 0755);  // on a tmpfs of the appliance's (/tmp, or one made here)
        } else if (!S_ISDIR(st.st_mode)) {
            Fail("can't reach %s: %s is not a directory", tree.path.c_str(), target.c_str());
        } else if ((st.st_mode & S_IXOTH) == 0 && slash != std::string::npos) {
            Mount("tmpfs", target, "tmpfs", 0, "mode=0755");
        }
        if (slash == std::string::npos)
            break;
    }
    const std::string source = "/proc/self/fd/" + std::to_string(tree.fd.get());
    Mount(source.c_str(), newRoot + tree.path, nullptr, MS_BIND | MS_REC, nullptr);
}

bool IsVolumeName(const std::string &name) {
    return name.rfind("volume", 0) == 0;
}

// Fills newRoot with the host's top-level entries, each in the form the appliance needs.
void PopulateRoot(const std::string &newRoot) {
    const std::unique_ptr<DIR, int (*)(DIR *)> root(opendir("/"), closedir);
    if (!root)
        FailErrno("can't list /");
    while (const dirent *entry = readdir(root.get())) {
        const std::string name = entry->d_name;
        const std::string host = "/" + name;
        const std::string target = newRoot + host;
        if (name == "." || name == ".." || host == kStateDir || IsVolumeName(name) || name == "lost+found")
            continue;
        struct stat st {};
        if (lstat(host.c_str(), &st) != 0)
            continue;
        if (S_ISLNK(st.st_mode)) {
            CopySymlink(host, target);
        } else if (name == "etc" || name == "usr") {
            MountOverlay(host, newRoot);
        } else if (name == "tmp") {
            MountTmpfs(target, "1777");
        } else if (name == "run" || name == "etc.defaults") {
            // /run fresh too: a host nscd or sssd socket there would answer for the host's users.
            MountTmpfs(target, "0755");
        } else if (name == "dev") {
            BuildDev(target);
        } else if (host == kNewRoot) {
            MakeDir(target, 0755);
        } else if (name == "proc") {
            BindInto(host, target);
        } else if (S_ISDIR(st.st_mode) || S_ISREG(st.st_mode)) {
            // Read-only: the appliance may read the host's programs and data (/var, /opt, a
            // checkout...) but must not change them.
            BindInto(host, target);
            MakeReadOnly(target);
        }
    }
    struct stat st {};
    if (lstat((newRoot + "/etc.defaults").c_str(), &st) != 0)
        MountTmpfs(newRoot + "/etc.defaults", "0755");
}

}  // namespace

void MountTmpfs(const std::string &path, const char *mode) {
    MakeParents(path);
    MakeDir(path, 0755);
    const std::string options = std::string("mode=") + mode;
    Mount("tmpfs", path, "tmpfs", 0, options.c_str());
}

void EnterPrivateRoot(const std::vector<std::string> &reachable) {
    if (geteuid() != 0)
        Fail("the appliance needs root (it mounts file systems in a private namespace)");
    char cwd[PATH_MAX];
    const bool haveCwd = getcwd(cwd, sizeof cwd) != nullptr;

    if (unshare(CLONE_NEWNS) != 0)
        FailErrno("can't create a mount namespace");
    // Private before anything else, so no mount below can propagate back to the host.
    Mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr);

    const std::vector<ReachableTree> trees = OpenReachableTrees(reachable);
    const std::string newRoot = kNewRoot;
    Mount("tmpfs", newRoot, "tmpfs", 0, "mode=0755");
    MakeDir(newRoot + kStateDir, 0700);
    PopulateRoot(newRoot);
    for (const ReachableTree &tree : trees)
        MountReachable(newRoot, tree);

    // pivot_root(".", ".") stacks the old root on the new one; detaching it leaves the new root.
    if (chdir(newRoot.c_str()) != 0)
        FailErrno("can't enter %s", newRoot.c_str());
    if (syscall(SYS_pivot_root, ".", ".") != 0)
        FailErrno("can't pivot into the private root");
    if (umount2(".", MNT_DETACH) != 0)
        FailErrno("can't detach the host's root");
    if (!haveCwd || chdir(cwd) != 0) {
        if (chdir("/") != 0)
            FailErrno("can't enter /");
    }

    for (const char *volume : {"/volume1", "/volume2"})
        MountTmpfs(volume, "0755");
}

}  // namespace norvo::testing::internal
