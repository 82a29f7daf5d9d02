// The listing of one directory for a user: access test, read, filter, fill, sort, page.
#include <dirent.h>
#include <errno.h>
#include <string.h>
#include <unistd.h>

#include <list>
#include <optional>
#include <string>

#include "common/log.h"
#include "common/modules.h"
#include "common/owners.h"
#include "common/text.h"
#include "norvo/errors.h"
#include "norvo/norvoenum.h"
#include "norvo/norvosearch.h"
#include "norvoenum/info_flags.h"
#include "norvoenum/listing_scope.h"
#include "norvoenum/remote_mount.h"
#include "quib_fs.h"
#include "quib_stat.h"

using norvo::kNorvoEnum;

namespace {

// The library error of a failed chdir into the directory (the access test). The log line keeps
// its fixed number, 152, for the unexpected errors.
int EnterError(const char *realPath, int err) {
    if (norvo::IsUnreachableErrno(err) && norvo::OnRemoteMount(realPath)) {
        return NVO_ERR_REMOTE_FS;
    }
    if (err == EACCES || err == EPERM) {
        return NVO_ERR_PRIVILEGE;
    }
    if (err == ENOENT) {
        return NVO_ERR_NO_PATH;
    }
    errno = err;  // for %m
    NVO_LOG_AT(kNorvoEnum, 152, "%s:%d Failed to access %s, errno=%m", realPath);
    return NVO_ERR_ACCESS;
}

// Conditions decide on the bare name here: the stat record they get is deliberately unfilled.
bool PassesAll(const std::vector<FileSearch::FindComp *> &conditions, const char *name) {
    static const _tag_QUIBSTAT_ kUnfilled{};
    for (FileSearch::FindComp *condition : conditions) {
        if (condition != nullptr && !(*condition)(name, kUnfilled)) {
            return false;
        }
    }
    return true;
}

// The paths FillFileInfo sets when no listing defers them: the directory's paths, '/', the name
// (the directory entry's name, which holds no NUL).
void SetPaths(std::list<DIRENTRY_INFO> &out, const char *userPath, const char *realPath, int fillInfo) {
    std::string userChild(userPath);
    userChild += '/';
    const size_t userBase = userChild.size();
    std::string realChild(realPath);
    realChild += '/';
    const size_t realBase = realChild.size();
    for (DIRENTRY_INFO &entry : out) {
        userChild.resize(userBase);
        userChild += entry.name;
        entry.path = userChild;
        if (fillInfo & NVO_INFO_REAL_PATH) {
            realChild.resize(realBase);
            realChild += entry.name;
            entry.real_path = realChild;
        }
    }
}

}  // namespace

int NvoEnum::NvoLibDirEntryListEnum(const char *userPath, const char *realPath, const char *sortKey, int info,
                                    unsigned long offset, unsigned long limit, bool ascending,
                                    _tag_dir_entry_type_ type, std::vector<FileSearch::FindComp *> conditions,
                                    std::list<DIRENTRY_INFO> &out, unsigned long *total) {
    NvoLibSetErr(NVO_ERR_NONE);
    if (norvo::IsEmpty(userPath) || norvo::IsEmpty(realPath) || total == nullptr) {
        NvoLibSetErr(NVO_ERR_GENERAL);
        return 0;
    }
    // The root of the user-visible tree is the share listing's.
    if (strcmp(userPath, "/") == 0) {
        NvoLibSetErr(NVO_ERR_PRIVILEGE);
        return 0;
    }
    *total = 0;
    bool deferred = false;
    try {
        if (chdir(realPath) != 0) {
            NvoLibSetErr(EnterError(realPath, errno));
            return 0;
        }
        if (chdir("/") != 0) {
            const int err = errno;
            if (err == EACCES || err == EPERM) {
                NvoLibSetErr(NVO_ERR_PRIVILEGE);
                return 0;
            }
            NVO_LOG_AT(kNorvoEnum, 161, "%s:%d Failed to access %s, errno=%m", realPath);
            NvoLibSetErr(NVO_ERR_ACCESS);
            return 0;
        }
        norvo::DirHandle dir(opendir(realPath));
        if (!dir) {
            const int err = errno;
            if (norvo::IsUnreachableErrno(err) && norvo::OnRemoteMount(realPath)) {
                NvoLibSetErr(NVO_ERR_REMOTE_FS);
                return 0;
            }
            if (err == ENOENT || err == ENOTDIR) {
                NvoLibSetErr(NVO_ERR_NO_PATH);
                return 0;
            }
            // Intended: a folder that can be entered but not read lists as empty, successfully.
            if (err == EACCES || err == EPERM) {
                return 1;
            }
            NvoLibSetErr(NVO_ERR_ACCESS);
            return 0;
        }
        const int fillInfo = norvo::WidenInfoBySortKey(sortKey, info);
        // The child paths reuse one buffer each: only the name part changes per entry.
        std::string realChild(realPath);
        realChild += '/';
        const size_t realBase = realChild.size();
        std::string userChild(userPath);
        userChild += '/';
        const size_t userBase = userChild.size();
        // Into an empty list, the kept records get their paths at the end, after the page is cut
        // (SetPaths); records the caller passed in are never touched that way.
        deferred = out.empty();
        std::optional<norvo::ListingScope> scope;
        if (deferred) {
            scope.emplace();
        }
        // Lets the entries' stat, ACL mask and ACL support share one statx each. Without it (it
        // can't be opened) the answers are the same, only dearer.
        norvo::DirPass pass(QUIBDirPassBegin(realPath));
        while (const struct dirent *found = readdir(dir.get())) {
            const char *name = found->d_name;
            if (QUIBEAIsHiddenFile(name) == 1 || !PassesAll(conditions, name)) {
                continue;
            }
            realChild.resize(realBase);
            realChild += name;
            userChild.resize(userBase);
            userChild += name;
            // Filled in place, so the record's strings are built once.
            DIRENTRY_INFO &entry = out.emplace_back();
            const int kept = FillFileInfo(userChild.c_str(), realChild.c_str(), name, type, found->d_type,
                                          fillInfo, entry);
            if (kept < 0) {
                out.pop_back();
                pass.reset();
                scope.reset();
                if (deferred) {
                    SetPaths(out, userPath, realPath, fillInfo);
                }
                return 0;
            }
            if (kept != 0 && entry.mount_point_type != "remotefail") {
                out.pop_back();
            }
        }
        dir.reset();
        pass.reset();
        scope.reset();
        if (sortKey != nullptr) {
            EntryListSort(out, sortKey);
        }
        // Descending order reverses the whole list, ties and the folders-first rule included.
        if (!ascending) {
            out.reverse();
        }
        *total = out.size();
        if (limit != 0) {
            NvoLibDirEntrySlice(out, offset, limit);
        }
        if (deferred) {
            SetPaths(out, userPath, realPath, fillInfo);
        }
        return 1;
    } catch (...) {
        // Only memory can run out here.
        if (deferred) {
            try {
                SetPaths(out, userPath, realPath, norvo::WidenInfoBySortKey(sortKey, info));
            } catch (...) {
            }
        }
        NvoLibSetErr(NVO_ERR_SYSTEM);
        return 0;
    }
}
