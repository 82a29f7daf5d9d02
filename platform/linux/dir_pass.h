// The state of an open directory pass (quib_dir_pass.h) and what the file calls ask of it.
#pragma once
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/types.h>

#include <string>

#include "acl_eval.h"
#include "locked_file.h"
#include "quib_dir_pass.h"

struct QUIBDirPass {
    std::string dirPath;
    norvo::platform::FileDescriptor dir;  // O_PATH: reaches the entries, reads nothing
    QUIBDirPass *outer = nullptr;         // the thread's pass before this one

    // The entry asked about last: its name and its statx, or the errno that statx gave.
    std::string entryName;
    struct statx entry {};
    int entryError = 0;
    bool entryKnown = false;

    // Read at the first permission question.
    norvo::platform::acl::Identity identity;
    bool identityKnown = false;

    // The directory's own statx (or errno), and whether the pass's identity may write and
    // search it (-1 not judged yet): what deleting any entry needs.
    struct statx dirInfo {};
    int dirError = 0;
    bool dirKnown = false;
    int dirWriteSearch = -1;
};

namespace norvo::platform {

// The thread's current pass when path names a direct entry of its directory; *name then points
// at the entry's name inside path. Null otherwise.
QUIBDirPass *PassOf(const char *path, const char **name);

// The entry's statx, with every field a call inside a pass may need: read once per entry. 0 or
// the errno.
int PassEntryStat(QUIBDirPass *pass, const char *name, struct statx *info);

// The directory's own statx, read once per pass. 0 or the errno.
int PassDirStat(QUIBDirPass *pass, struct statx *info);

// The pass's identity (read on first use). Null with errno when it can't be read.
const acl::Identity *PassIdentity(QUIBDirPass *pass);

// lgetxattr of the entry, resolved in the pass's directory; path (the entry's whole path) is
// used instead on kernels without getxattrat.
ssize_t PassGetXattr(QUIBDirPass *pass, const char *name, const char *path, const char *attribute,
                     void *value, size_t size);

}  // namespace norvo::platform
