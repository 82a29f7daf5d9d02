// The sub-folders of one real directory, for the folder tree. The directory is opened once and
// everything after that (entering it, reading it, the stat of each entry) goes through that
// descriptor, so the folder entered is the folder read even if its path is swapped meanwhile.
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <iterator>
#include <string>
#include <vector>

#include "common/beneath.h"
#include "common/log.h"
#include "common/modules.h"
#include "common/owners.h"
#include "common/remote_mount.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/subdirs.h"
#include "quib_fs.h"
#include "quib_webutils.h"
#include "vlibc_unicode.h"

using Record = _tag_SUBDIR_ENTRY_INFO_;

namespace {

// The library error of a directory that can't be entered, opened or read.
int DirError(int err) {
    if (err == ENOENT || err == ENOTDIR) {
        return NVO_ERR_NO_PATH;
    }
    if (err == EACCES || err == EPERM) {
        return NVO_ERR_PRIVILEGE;
    }
    return NVO_ERR_ACCESS;
}

int Refuse(int err) {
    NvoLibSetErr(DirError(err));
    return 0;
}

// The record of entry name of the directory open on dirFd, whose path is parent; false when the
// entry is no folder to list. Failures here only leave the entry out.
bool ReadEntry(int dirFd, const std::string &parent, const struct dirent &entry, Record *record) {
    if (entry.d_type != DT_DIR && entry.d_type != DT_UNKNOWN) {
        return false;
    }
    if (QUIBEAIsHiddenFile(entry.d_name) != 0) {
        return false;
    }
    record->name = entry.d_name;
    record->path = parent + '/' + record->name;
    struct stat st;
    if (fstatat(dirFd, entry.d_name, &st, AT_SYMLINK_NOFOLLOW) != 0) {
        // A network mount whose server is gone stays in the tree, so that it can be seen and
        // unmounted; its facts are unknown.
        if (!norvo::OnRemoteMount(record->path.c_str())) {
            return false;
        }
        record->isMountPoint = true;
        record->mountType = "remotefail";
        return true;
    }
    if (!S_ISDIR(st.st_mode)) {
        return false;  // links to folders among them
    }
    record->size = static_cast<uint64_t>(st.st_size);
    record->mode = st.st_mode;
    record->mtime = static_cast<int32_t>(st.st_mtime);
    record->uid = st.st_uid;
    record->gid = st.st_gid;
    record->isMountPoint = WebUtils::IsMountPoint(record->path);
    if (record->isMountPoint) {
        record->mountType = WebUtils::getMountType(record->path);
    }
    return true;
}

int EnumSubDir(const std::string &path, std::vector<Record> &out) {
    // A relative path would be read against whatever the working directory is by then, and a
    // NUL would cut the path opened short of the one the records name.
    if (path.empty() || path[0] != '/' || path.find('\0') != std::string::npos) {
        NvoLibSetErr(NVO_ERR_GENERAL);
        NVO_LOG_AT(norvo::kNorvoDir, 356, "%s:%d Bad parameter");
        return 0;
    }
    NvoLibSetErr(NVO_ERR_NONE);
    norvo::OwnedFd opened(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!opened.IsOpen()) {
        return Refuse(errno);
    }
    // Entering the folder is the access test, and callers count on the working directory.
    if (fchdir(opened.Get()) != 0) {
        return Refuse(errno);
    }
    norvo::DirHandle dir(fdopendir(opened.Get()));
    if (!dir) {
        return Refuse(errno);
    }
    opened.Release();  // the directory stream owns it now
    std::vector<Record> found;
    for (;;) {
        errno = 0;
        const struct dirent *entry = readdir(dir.get());
        if (entry == nullptr) {
            // A folder tree missing folders that exist would mislead: a read error fails the call.
            if (errno != 0) {
                return Refuse(errno);
            }
            break;
        }
        Record record;
        if (ReadEntry(dirfd(dir.get()), path, *entry, &record)) {
            found.push_back(std::move(record));
        }
    }
    dir.reset();
    // Nothing below throws once the room is there, so a failure leaves out as it was.
    out.reserve(out.size() + found.size());
    out.insert(out.end(), std::make_move_iterator(found.begin()), std::make_move_iterator(found.end()));
    std::sort(out.begin(), out.end(), NvoLibSubDirNameLess);
    return 1;
}

}  // namespace

bool NvoLibSubDirNameLess(const Record &a, const Record &b) {
    return VLIBCUnicodeUTF8StrCaseCmp(a.name.c_str(), b.name.c_str()) < 0;
}

int NvoLibEnumSubDir(std::string path, std::vector<Record> &out) {
    return norvo::Guarded(0, [&] { return EnumSubDir(path, out); });
}
