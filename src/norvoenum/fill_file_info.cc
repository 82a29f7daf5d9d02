// One listed entry: kept or skipped by its type, then its facts read from one stat of the entry,
// as far as the info flags ask.
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
#include "norvoenum/entry_facts.h"
#include "quib_fs.h"
#include "quib_stat.h"

using norvo::EntryFacts;
using norvo::EntryVerdict;
using norvo::kNorvoEnum;

namespace {

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
EntryVerdict StatFailure(const char *realPath, int err, EntryFacts *facts) {
    if (err == EPERM || err == EACCES) {
        NvoLibSetErr(NVO_ERR_PRIVILEGE);
        LogStatFailure(realPath, err);
        return EntryVerdict::kFail;
    }
    if (norvo::IsUnreachableErrno(err)) {
        // The user sees the lost mount as a folder.
        if (norvo::OnRemoteMount(realPath)) {
            facts->isdir = true;
            facts->mountPointType = "remotefail";
            return EntryVerdict::kUnreachable;
        }
        if (err == ENOENT) {
            return EntryVerdict::kSkip;  // gone between the directory read and the stat
        }
        // Intended: an I/O error off network mounts ends the listing without a library error.
        LogStatFailure(realPath, err);
        return EntryVerdict::kFail;
    }
    NvoLibSetErr(NVO_ERR_SYSTEM);
    LogStatFailure(realPath, err);
    return EntryVerdict::kFail;
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

}  // namespace

namespace norvo {

void CopyFacts(const EntryFacts &facts, int info, NorvoUserEnum &names, DIRENTRY_INFO *entry) {
    if (info & NVO_INFO_SIZE) {
        entry->size = facts.size;
    }
    if (info & NVO_INFO_OWNER) {
        entry->uid = facts.uid;
        entry->gid = facts.gid;
        entry->user = names.GetUserNameByUID(facts.uid);
        entry->group = names.GetGroupNameByGID(facts.gid);
    }
    if (info & NVO_INFO_TIME) {
        entry->mtime = facts.mtime;
        entry->ctime = facts.ctime;
        entry->crtime = facts.crtime;
        entry->atime = facts.atime;
    }
    if (info & NVO_INFO_PERM) {
        entry->mode = facts.mode;
        entry->acl_privilege = facts.aclPrivilege;
        entry->is_acl_mode = facts.isAclMode;
    }
}

void LowerExtension(const char *name, std::string *type) {
    const char *ext = ReturnFileExt(name, 0);
    if (ext == nullptr) {
        type->clear();
        return;
    }
    type->assign(ext);
    for (char &c : *type) {
        c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
    }
}

EntryVerdict ReadEntryFacts(NorvoMountStatus &mounts, const char *realPath, _tag_dir_entry_type_ type,
                            unsigned char dtype, int info, EntryFacts *facts) {
    facts->isdir = (dtype & DT_DIR) != 0;
    if (dtype != DT_UNKNOWN) {
        // Links, devices, pipes and sockets are never listed.
        if ((dtype != DT_DIR && dtype != DT_REG) || !Wanted(type, dtype == DT_DIR)) {
            return EntryVerdict::kSkip;
        }
        if (info < NVO_INFO_SIZE) {
            return EntryVerdict::kKeep;  // the reader told everything that was asked
        }
    }
    _tag_QUIBSTAT_ st{};
    const int statFlags = QUIB_STAT_BASIC | ((info & NVO_INFO_TIME) ? QUIB_STAT_CRTIME : 0);
    if (VLIBCFileLStat(realPath, statFlags, &st) != 0) {
        return StatFailure(realPath, errno, facts);
    }
    const mode_t kind = st.st_mode & S_IFMT;
    if ((kind != S_IFDIR && kind != S_IFREG) || !Wanted(type, kind == S_IFDIR)) {
        return EntryVerdict::kSkip;
    }
    facts->isdir = kind == S_IFDIR;
    if ((info & NVO_INFO_MOUNT_POINT_TYPE) && facts->isdir) {
        facts->mountPointType = MountPointType(mounts.getFSTYPE(realPath));
    }
    facts->size = static_cast<uint64_t>(st.st_size);
    facts->uid = st.st_uid;
    facts->gid = st.st_gid;
    facts->mtime = st.st_mtim.tv_sec;
    facts->ctime = st.st_ctim.tv_sec;
    facts->crtime = st.st_crtim.tv_sec;
    facts->atime = st.st_atim.tv_sec;
    facts->mode = st.st_mode;
    if (info & NVO_INFO_PERM) {
        facts->aclPrivilege = GetACLPrivilege(realPath);
        // Intended: a failed probe (-1) counts as ACL mode too.
        facts->isAclMode = QUIBACLIsSupport(realPath, -1, 2) != 0;
    }
    return EntryVerdict::kKeep;
}

}  // namespace norvo

int NvoEnum::FillFileInfo(const char *userPath, const char *realPath, const char *name,
                          _tag_dir_entry_type_ type, unsigned char dtype, int info, DIRENTRY_INFO &entry) {
    if (userPath == nullptr || realPath == nullptr || name == nullptr) {
        NvoLibSetErr(NVO_ERR_GENERAL);
        return -1;
    }
    try {
        entry.name = name;
        entry.path = userPath;
        if (info & NVO_INFO_REAL_PATH) {
            entry.real_path = realPath;
        }
        EntryFacts facts;
        const EntryVerdict verdict = norvo::ReadEntryFacts(*this, realPath, type, dtype, info, &facts);
        entry.isdir = facts.isdir;
        switch (verdict) {
            case EntryVerdict::kKeep:
                break;
            case EntryVerdict::kUnreachable:
                entry.mount_point_type = facts.mountPointType;
                return 1;  // skipped, yet a listing keeps it
            case EntryVerdict::kSkip:
                return 1;
            case EntryVerdict::kFail:
                return -1;
        }
        if (info & NVO_INFO_MOUNT_POINT_TYPE) {
            entry.mount_point_type = facts.mountPointType;
        }
        if ((info & NVO_INFO_TYPE) && !entry.isdir) {
            norvo::LowerExtension(name, &entry.type);
        }
        norvo::CopyFacts(facts, info, userEnum_, &entry);
        return 0;
    } catch (...) {
        // Only memory can run out here.
        NvoLibSetErr(NVO_ERR_SYSTEM);
        return -1;
    }
}
