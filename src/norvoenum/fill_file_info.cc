// One listed entry's record: kept or skipped by its type, then filled with as much file
// information as the info flags ask for, from one stat of the entry.
#include <ctype.h>
#include <dirent.h>
#include <errno.h>
#include <sys/stat.h>

#include "common/log.h"
#include "common/modules.h"
#include "common/remote_mount.h"
#include "norvo/errors.h"
#include "norvo/norvoenum.h"
#include "norvo/norvomisc.h"
#include "norvoenum/listing_scope.h"
#include "quib_fs.h"
#include "quib_stat.h"

using norvo::kNorvoEnum;

namespace {

constexpr int kKeep = 0;
constexpr int kSkip = 1;
constexpr int kFail = -1;

// The type filter: false when the entry is of a kind the caller did not ask for.
bool Wanted(_tag_dir_entry_type_ type, bool isDir) {
    switch (type) {
    case DIR_ENTRY_TYPE_DIR:
        return isDir;
    case DIR_ENTRY_TYPE_FILE:
        return !isDir;
    default:
        return true;
    }
}

void LogStatFailure(const char *realPath, int err) {
    errno = err;  // for %m
    NVO_LOG_AT(kNorvoEnum, 306, "%s:%d Failed to stat %s. %m", realPath);
}

// The outcome of a failed stat of the entry, by errno.
int StatFailure(const char *realPath, int err, DIRENTRY_INFO &entry) {
    if (err == EPERM || err == EACCES) {
        NvoLibSetErr(NVO_ERR_PRIVILEGE);
        LogStatFailure(realPath, err);
        return kFail;
    }
    if (norvo::IsUnreachableErrno(err)) {
        // Skipped, yet the listing keeps it: the user sees the lost mount as a folder.
        if (norvo::OnRemoteMount(realPath)) {
            entry.isdir = true;
            entry.mount_point_type = "remotefail";
            return kSkip;
        }
        if (err == ENOENT) {
            return kSkip;  // gone between the directory read and the stat
        }
        // Intended: an I/O error off network mounts ends the listing without a library error.
        LogStatFailure(realPath, err);
        return kFail;
    }
    NvoLibSetErr(NVO_ERR_SYSTEM);
    LogStatFailure(realPath, err);
    return kFail;
}

// "iso" for a disk image and "remote" for a network file system mounted exactly on the folder.
const char *MountPointType(int fsType) {
    if (QUIBFSIsImageFS(fsType) == 1) {
        return "iso";
    }
    if (QUIBFSIsRemoteFS(fsType) == 1) {
        return "remote";
    }
    return "";
}

void SetType(const char *name, std::string &type) {
    const char *ext = ReturnFileExt(name, 0);
    if (ext == nullptr) {
        type.clear();
        return;
    }
    type.assign(ext);
    for (char &c : type) {
        c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
    }
}

thread_local bool t_pathsDeferred = false;

}  // namespace

namespace norvo {

ListingScope::ListingScope() : outer_(t_pathsDeferred) { t_pathsDeferred = true; }

ListingScope::~ListingScope() { t_pathsDeferred = outer_; }

bool ListingScope::PathsDeferred() { return t_pathsDeferred; }

}  // namespace norvo

int NvoEnum::FillFileInfo(const char *userPath, const char *realPath, const char *name, _tag_dir_entry_type_ type,
                          unsigned char dtype, int info, DIRENTRY_INFO &entry) {
    if (userPath == nullptr || realPath == nullptr || name == nullptr) {
        NvoLibSetErr(NVO_ERR_GENERAL);
        return kFail;
    }
    try {
        entry.name = name;
        entry.isdir = (dtype & DT_DIR) != 0;
        if (!t_pathsDeferred) {
            entry.path = userPath;
            if (info & NVO_INFO_REAL_PATH) {
                entry.real_path = realPath;
            }
        }
        if (dtype != DT_UNKNOWN) {
            // Links, devices, pipes and sockets are never listed.
            if ((dtype != DT_DIR && dtype != DT_REG) || !Wanted(type, dtype == DT_DIR)) {
                return kSkip;
            }
            if (info < NVO_INFO_SIZE) {
                return kKeep;  // the reader told everything that was asked
            }
        }
        _tag_QUIBSTAT_ st{};
        const int statFlags = QUIB_STAT_BASIC | ((info & NVO_INFO_TIME) ? QUIB_STAT_CRTIME : 0);
        if (VLIBCFileLStat(realPath, statFlags, &st) != 0) {
            return StatFailure(realPath, errno, entry);
        }
        const mode_t kind = st.st_mode & S_IFMT;
        if ((kind != S_IFDIR && kind != S_IFREG) || !Wanted(type, kind == S_IFDIR)) {
            return kSkip;
        }
        entry.isdir = kind == S_IFDIR;
        if (info & NVO_INFO_MOUNT_POINT_TYPE) {
            entry.mount_point_type = entry.isdir ? MountPointType(getFSTYPE(realPath)) : "";
        }
        if ((info & NVO_INFO_TYPE) && !entry.isdir) {
            SetType(name, entry.type);
        }
        if (info & NVO_INFO_SIZE) {
            entry.size = static_cast<uint64_t>(st.st_size);
        }
        if (info & NVO_INFO_OWNER) {
            entry.uid = st.st_uid;
            entry.gid = st.st_gid;
            entry.user = userEnum_.GetUserNameByUID(st.st_uid);
            entry.group = userEnum_.GetGroupNameByGID(st.st_gid);
        }
        if (info & NVO_INFO_TIME) {
            entry.mtime = st.st_mtim.tv_sec;
            entry.ctime = st.st_ctim.tv_sec;
            entry.crtime = st.st_crtim.tv_sec;
            entry.atime = st.st_atim.tv_sec;
        }
        if (info & NVO_INFO_PERM) {
            entry.mode = st.st_mode;
            entry.acl_privilege = GetACLPrivilege(realPath);
            // Intended: a failed probe (-1) counts as ACL mode too.
            entry.is_acl_mode = QUIBACLIsSupport(realPath, -1, 2) != 0;
        }
        return kKeep;
    } catch (...) {
        // Only memory can run out here.
        NvoLibSetErr(NVO_ERR_SYSTEM);
        return kFail;
    }
}
