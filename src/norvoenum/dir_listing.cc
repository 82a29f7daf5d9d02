// The listing of one directory for a user: open it beneath its share's folder, read, filter,
// keep each entry's facts, then order and page them, and build only the page's records.
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <list>
#include <numeric>
#include <string>
#include <vector>

#include "common/beneath.h"
#include "common/log.h"
#include "common/modules.h"
#include "common/owners.h"
#include "common/path_names.h"
#include "common/remote_mount.h"
#include "common/text.h"
#include "norvo/errors.h"
#include "norvo/norvoenum.h"
#include "norvo/norvosearch.h"
#include "norvoenum/entry_facts.h"
#include "norvoenum/entry_order.h"
#include "norvoenum/info_flags.h"
#include "norvoenum/kept_entries.h"
#include "quib_dir_pass.h"
#include "quib_fs.h"

using norvo::EntryFacts;
using norvo::EntryVerdict;
using norvo::kNorvoEnum;

namespace {

// The library error of a directory that can't be entered. The log line keeps its fixed
// number, 152, for the unexpected errors.
int EnterError(const char *realPath, int err) {
    if (norvo::IsUnreachableErrno(err) && norvo::OnRemoteMount(realPath)) {
        return NVO_ERR_REMOTE_FS;
    }
    // A link on the way, or a way out of the share: the file manager goes nowhere through them.
    if (err == EACCES || err == EPERM || err == ELOOP || err == EXDEV) {
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

enum class Opened { kReadable, kUnreadable, kFailed };

// Opens the directory for reading beneath top, and makes the access test that entering it
// would: the right to search it. kUnreadable: it may be entered but not read (intended: such a
// folder lists as empty). kFailed: the error slot is set.
Opened OpenListed(const std::string &top, const char *realPath, norvo::OwnedFd *dir) {
    *dir = norvo::OpenBeneath(top, realPath, O_RDONLY | O_DIRECTORY);
    norvo::OwnedFd searchable;
    int err = errno;
    if (!dir->IsOpen()) {
        if (err != EACCES && err != EPERM) {
            NvoLibSetErr(EnterError(realPath, err));
            return Opened::kFailed;
        }
        // Not readable: is it reachable at all?
        searchable = norvo::OpenBeneath(top, realPath, O_PATH | O_DIRECTORY);
        if (!searchable.IsOpen()) {
            NvoLibSetErr(EnterError(realPath, errno));
            return Opened::kFailed;
        }
    }
    // "." is looked up in the folder, which needs the right to search it.
    struct stat st;
    if (fstatat(dir->IsOpen() ? dir->Get() : searchable.Get(), ".", &st, 0) != 0) {
        NvoLibSetErr(EnterError(realPath, errno));
        return Opened::kFailed;
    }
    return dir->IsOpen() ? Opened::kReadable : Opened::kUnreadable;
}

// The position space of a listing: first the records the caller's list held, then the kept
// entries. The caller's records take part in the order and the page like the new ones.
class Positions {
public:
    Positions(std::list<DIRENTRY_INFO> &out, const norvo::KeptEntries &kept, norvo::SortRule rule)
        : out_(out), kept_(kept), rule_(rule) {
        for (auto it = out.begin(); it != out.end(); ++it) {
            earlier_.push_back(it);
        }
    }

    size_t Count() const { return earlier_.size() + kept_.Size(); }

    norvo::SortFacts FactsAt(size_t i) const {
        return i < earlier_.size() ? norvo::SortFactsOf(rule_, *earlier_[i])
                                   : kept_.FactsAt(i - earlier_.size());
    }

    // Makes out the records at order[first, last): earlier records are moved, kept entries
    // built; every other earlier record goes. Throws (std::bad_alloc) only before out changes.
    void Page(const std::vector<size_t> &order, size_t first, size_t last, const std::string &userDir,
              const std::string &realDir, NorvoUserEnum &names) {
        std::list<DIRENTRY_INFO> built;
        for (size_t i = first; i < last; ++i) {
            if (order[i] >= earlier_.size()) {
                kept_.Build(order[i] - earlier_.size(), userDir, realDir, names, built.emplace_back());
            }
        }
        std::list<DIRENTRY_INFO> page;
        for (size_t i = first; i < last; ++i) {
            if (order[i] < earlier_.size()) {
                page.splice(page.end(), out_, earlier_[order[i]]);
            } else {
                page.splice(page.end(), built, built.begin());
            }
        }
        out_.swap(page);
    }

private:
    std::list<DIRENTRY_INFO> &out_;
    const norvo::KeptEntries &kept_;
    norvo::SortRule rule_;
    std::vector<std::list<DIRENTRY_INFO>::iterator> earlier_;
};

// What a failed listing leaves in out: the earlier records, then the entries kept so far in
// the reader's order, as they would be had each gone into the list when it was filled.
void KeepInReaderOrder(const norvo::KeptEntries &kept, const std::string &userDir, const std::string &realDir,
                       NorvoUserEnum &names, std::list<DIRENTRY_INFO> &out) {
    std::list<DIRENTRY_INFO> records;
    for (size_t i = 0; i < kept.Size(); ++i) {
        kept.Build(i, userDir, realDir, names, records.emplace_back());
    }
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
    const int fillInfo = norvo::WidenInfoBySortKey(sortKey, info);
    const norvo::SortRule rule = norvo::SortRuleOf(sortKey != nullptr ? sortKey : "");
    const std::string userDir = userPath;
    const std::string realDir = realPath;
    norvo::KeptEntries kept(rule, fillInfo);
    try {
        // The real path is the share's (or home's) folder with the rest of the user path; what
        // does not read so, or climbs with "..", is not a resolved user path.
        std::string top;
        if (norvo::HasDotComponent(userDir) || !norvo::TopOf(userDir, realDir, &top)) {
            NvoLibSetErr(NVO_ERR_GENERAL);
            return 0;
        }
        *total = 0;
        norvo::OwnedFd opened;
        switch (OpenListed(top, realPath, &opened)) {
            case Opened::kFailed:
                return 0;
            case Opened::kUnreadable:
                return 1;
            case Opened::kReadable:
                break;
        }
        // Entries are stat'ed and judged in the directory opened, never by walking the path
        // again (which a link swapped in meanwhile could redirect).
        const norvo::DirPass pass(QUIBDirPassBeginAt(opened.Get(), realPath));
        if (!pass) {
            NvoLibSetErr(NVO_ERR_SYSTEM);
            return 0;
        }
        norvo::DirHandle dir(fdopendir(opened.Get()));
        if (!dir) {
            NvoLibSetErr(NVO_ERR_SYSTEM);
            return 0;
        }
        opened.Release();  // the directory stream owns it now
        std::string realChild = realDir + '/';
        const size_t realBase = realChild.size();
        while (const struct dirent *found = readdir(dir.get())) {
            const char *name = found->d_name;
            if (QUIBEAIsHiddenFile(name) == 1 || !PassesAll(conditions, name)) {
                continue;
            }
            realChild.resize(realBase);
            realChild += name;
            EntryFacts facts;
            const EntryVerdict verdict =
                norvo::ReadEntryFacts(*this, realChild.c_str(), type, found->d_type, fillInfo, &facts);
            if (verdict == EntryVerdict::kFail) {
                KeepInReaderOrder(kept, userDir, realDir, userEnum_, out);
                return 0;
            }
            if (verdict != EntryVerdict::kSkip) {
                kept.Add(name, facts);
            }
        }
        dir.reset();
        Positions positions(out, kept, rule);
        std::vector<size_t> order;
        if (sortKey != nullptr) {
            order = norvo::SortedPositions(positions.Count(), rule,
                                           [&](size_t i) { return positions.FactsAt(i); });
        } else {
            order.resize(positions.Count());
            std::iota(order.begin(), order.end(), size_t{0});
        }
        // Descending order reverses the whole list, ties and the folders-first rule included.
        if (!ascending) {
            std::reverse(order.begin(), order.end());
        }
        size_t first = 0;
        size_t last = 0;
        norvo::PageRange(order.size(), offset, limit, &first, &last);
        positions.Page(order, first, last, userDir, realDir, userEnum_);
        *total = order.size();
        return 1;
    } catch (...) {
        // Only memory can run out here.
        try {
            KeepInReaderOrder(kept, userDir, realDir, userEnum_, out);
        } catch (...) {
        }
        NvoLibSetErr(NVO_ERR_SYSTEM);
        return 0;
    }
}
