// norvo-deadremote: a network file system whose server has gone away. Every lookup, including
// the mount root's own attributes, answers EIO, as a CIFS or NFS mount does once its server is
// unreachable. The mount reads "deadremote on PATH type fuse.norvo-deadremote".
//
//   norvo-deadremote [FUSE options] MOUNTPOINT      (the sandbox passes -f -o allow_other)
#define FUSE_USE_VERSION 31
#include <fuse.h>

#include <cerrno>
#include <vector>

namespace {

int DeadGetattr(const char *, struct stat *, fuse_file_info *) {
    return -EIO;
}
int DeadAccess(const char *, int) {
    return -EIO;
}
int DeadOpendir(const char *, fuse_file_info *) {
    return -EIO;
}
int DeadReaddir(const char *, void *, fuse_fill_dir_t, off_t, fuse_file_info *, fuse_readdir_flags) {
    return -EIO;
}

fuse_operations DeadOperations() {
    fuse_operations ops{};
    ops.getattr = DeadGetattr;
    ops.access = DeadAccess;
    ops.opendir = DeadOpendir;
    ops.readdir = DeadReaddir;
    // statfs keeps libfuse's default answer: the kernel's mount table and statfs still tell
    // what kind of file system this is, as they do for a hung network mount.
    return ops;
}

}  // namespace

int main(int argc, char *argv[]) {
    std::vector<char *> args(argv, argv + argc);
    // Single-threaded: nothing here is worth threads, and libfuse 3.14's multi-threaded loop
    // warns about its own default thread limit.
    static char single[] = "-s";
    static char option[] = "-o";
    static char names[] = "fsname=deadremote,subtype=norvo-deadremote";
    args.insert(args.begin() + 1, {single, option, names});
    static const fuse_operations ops = DeadOperations();
    return fuse_main(int(args.size()), args.data(), &ops, nullptr);
}
