// The listing of one directory for a user: access test, read, filter, fill, sort, page.
#include <dirent.h>
#include <errno.h>
#include <string.h>
#include <unistd.h>

#include <algorithm>
#include <list>
#include <numeric>
#include <optional>
#include <string>
#include <vector>

#include "common/log.h"
#include "common/modules.h"
#include "common/owners.h"
#include "common/remote_mount.h"
#include "common/text.h"
#include "norvo/errors.h"
#include "norvo/norvoenum.h"
#include "norvo/norvosearch.h"
#include "norvoenum/entry_order.h"
#include "norvoenum/info_flags.h"
#include "norvoenum/kept_entries.h"
#include "norvoenum/listing_scope.h"
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

// A fresh record in place of the last one, keeping its strings' buffers for the next fill.
DIRENTRY_INFO &FreshRecord(DIRENTRY_INFO &record) {
    std::string name = std::move(record.name);
    std::string type = std::move(record.type);
    std::string user = std::move(record.user);
    std::string group = std::move(record.group);
    record = DIRENTRY_INFO{};
    name.clear();
    type.clear();
    user.clear();
    group.clear();
    record.name = std::move(name);
    record.type = std::move(type);
    record.user = std::move(user);
    record.group = std::move(group);
    return record;
}

// What a failed listing leaves in out: the records kept so far, in the reader's order, with
// their paths, as they would be had each gone into the list when it was filled.
void RestoreInReaderOrder(const norvo::KeptEntries &kept, const char *userPath, const char *realPath, int fillInfo,
                          std::list<DIRENTRY_INFO> &out) {
    std::list<DIRENTRY_INFO> records;
    for (size_t i = 0; i < kept.Size(); ++i) {
        kept.Restore(i, records.emplace_back());
    }
    SetPaths(records, userPath, realPath, fillInfo);
    out.splice(out.end(), records);
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
    const int fillInfo = norvo::WidenInfoBySortKey(sortKey, info);
    const norvo::SortRule rule = norvo::SortRuleOf(sortKey != nullptr ? sortKey : "");
    // Into an empty list, the kept records wait compactly (kept) and only the page becomes
    // records, with their paths; records the caller passed in are sorted with the new ones, so
    // then every record is built in the list itself.
    const bool compact = out.empty();
    std::optional<norvo::KeptEntries> kept;
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
        // The child paths reuse one buffer each: only the name part changes per entry.
        std::string realChild(realPath);
        realChild += '/';
        const size_t realBase = realChild.size();
        std::string userChild(userPath);
        userChild += '/';
        const size_t userBase = userChild.size();
        std::optional<norvo::ListingScope> scope;
        DIRENTRY_INFO scratch;  // the record being filled, when kept compactly
        if (compact) {
            kept.emplace(rule);
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
            DIRENTRY_INFO &entry = compact ? FreshRecord(scratch) : out.emplace_back();
            const int result = FillFileInfo(userChild.c_str(), realChild.c_str(), name, type, found->d_type,
                                            fillInfo, entry);
            const bool keep = result == 0 || (result > 0 && entry.mount_point_type == "remotefail");
            if (compact && keep) {
                kept->Add(entry);
            } else if (!compact && !keep) {
                out.pop_back();
            }
            if (result < 0) {
                pass.reset();
                scope.reset();
                if (compact) {
                    RestoreInReaderOrder(*kept, userPath, realPath, fillInfo, out);
                }
                return 0;
            }
        }
        dir.reset();
        pass.reset();
        scope.reset();
        if (!compact) {
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
            return 1;
        }
        // The same steps on the kept records' positions.
        std::vector<size_t> order;
        if (sortKey != nullptr) {
            order = norvo::SortedPositions(kept->Size(), rule, [&](size_t i) { return kept->FactsAt(i); });
        } else {
            order.resize(kept->Size());
            std::iota(order.begin(), order.end(), size_t{0});
        }
        if (!ascending) {
            std::reverse(order.begin(), order.end());
        }
        size_t first = 0;
        size_t last = 0;
        norvo::PageRange(order.size(), offset, limit, &first, &last);
        std::list<DIRENTRY_INFO> page;
        for (size_t i = first; i < last; ++i) {
            kept->Restore(order[i], page.emplace_back());
        }
        SetPaths(page, userPath, realPath, fillInfo);
        out.splice(out.end(), page);
        *total = order.size();
        return 1;
    } catch (...) {
        // Only memory can run out here.
        if (kept.has_value()) {
            try {
                RestoreInReaderOrder(*kept, userPath, realPath, fillInfo, out);
            } catch (...) {
            }
        }
        NvoLibSetErr(NVO_ERR_SYSTEM);
        return 0;
    }
}
