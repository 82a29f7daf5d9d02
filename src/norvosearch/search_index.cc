// NvoSearchWalker::WalkDB: a volume's search through its index. The index answers the name,
// type, size, owner and time conditions; every row it returns is then held to what a walk of
// the same folders as the same user would report, so both ways give the same hits: the row
// must lie in a chosen folder (of that share: the index's path conditions don't name one), be
// out of no hidden name or recycle bin, in a folder the user may list and that no link leads
// to, and still meet every condition on the file's current status (the index may be older
// than the file; an access time it can't know at all).
#include <errno.h>
#include <string.h>
#include <sys/stat.h>

#include <algorithm>
#include <deque>
#include <map>
#include <string>
#include <vector>

#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/searchwalker.h"
#include "norvosearch/search_db_record.h"
#include "norvosearch/search_scope.h"
#include "quib_fs.h"
#include "quib_share.h"
#include "quib_stat.h"
#include "quib_user.h"
#include "vlibc_err.h"

using norvo::kNorvoSearch;

namespace FileSearch {
namespace {

struct FilterContext {
    DirPrivilegeMap privileges;
    std::vector<FindATimeComp *> extra;  // decided on the file's status now, read per row
    const std::vector<PathInfo> *folders = nullptr;
    bool currentDirOnly = false;
    bool admin = false;  // told, but an administrator sees what they may list too
    // The answer for the folder of the rows before: rows come folder by folder.
    std::string dir;
    bool dirKept = false;
    size_t depth = 0;  // of the folder below its share's
};

// The chosen folder dir lies in (or is, with currentDirOnly); null when none.
const PathInfo *FolderOf(const FilterContext &ctx, const std::string &dir) {
    for (const PathInfo &folder : *ctx.folders) {
        if (dir == folder.fullPath || (!ctx.currentDirOnly && dir.size() > folder.fullPath.size() &&
                                       dir.compare(0, folder.fullPath.size(), folder.fullPath) == 0 &&
                                       dir[folder.fullPath.size()] == '/')) {
            return &folder;
        }
    }
    return nullptr;
}

// Whether rows of the folder dir may be kept at all, their names aside.
bool KeepDir(FilterContext &ctx, const std::string &dir) {
    std::string root, rest;
    if (FolderOf(ctx, dir) == nullptr ||
        norvo::search::SplitRealPath(dir + "/", &root, &rest) != norvo::search::SplitResult::kOk) {
        return false;
    }
    if (!rest.empty()) {
        rest.pop_back();
    }
    ctx.depth = rest.empty() ? 0 : 1 + static_cast<size_t>(std::count(rest.begin(), rest.end(), '/'));
    return !norvo::search::OutOfSight(root, rest) && ctx.privileges.findDirPrivilege(dir + "/");
}

// The platform hands only rows it has just looked at as the caller, in a folder it opened from
// the volume one component at a time without following a link, that meet the whole chain on
// that status and, with conditions, are regular files or folders. What it can't know is
// checked here: the chosen folders by share, hidden names and bins, the user's list privilege
// (once per folder), and the access-time extras on the file's status read again.
int KeepRow(const char *dir, const char *name, void *arg) {
    return norvo::Guarded(0, [&] {
        FilterContext &ctx = *static_cast<FilterContext *>(arg);
        if (ctx.dir != dir) {
            ctx.dir = dir;
            ctx.dirKept = KeepDir(ctx, ctx.dir);
        }
        if (!ctx.dirKept || QUIBEAIsHiddenFile(name) != 0) {
            return 0;
        }
        // A bin is a share's top folder, or a home's one level deeper.
        if (ctx.depth < 2) {
            const std::string bin = ctx.dir + "/" + name;
            if (QUIBShareIsShareRecycle(bin.c_str()) == 1) {
                return 0;
            }
        }
        if (ctx.extra.empty()) {
            return 1;
        }
        const std::string path = ctx.dir + "/" + name;
        _tag_QUIBSTAT_ st{};
        if (VLIBCFileLStat(path.c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st) != 0) {
            NVO_LOG(kNorvoSearch, "%s:%d VLIBCFileLStat: (%s), %s, [%x].", path.c_str(), strerror(errno),
                    static_cast<unsigned>(VLIBCErrGet()));
            return 0;
        }
        if (!S_ISREG(st.st_mode) && !S_ISDIR(st.st_mode)) {
            return 0;
        }
        for (FindATimeComp *cond : ctx.extra) {
            if (!(*cond)(path.c_str(), st)) {
                return 0;
            }
        }
        return 1;
    });
}

// A copy of the chain from head without its access-time records, which the index can't
// answer (the row filter does). Records are kept in out.
__tag_FI_SQL_COND *WithoutAccessTimes(const __tag_FI_SQL_COND *head, std::deque<__tag_FI_SQL_COND> *out,
                                      std::map<const __tag_FI_SQL_COND *, __tag_FI_SQL_COND *> *copied) {
    while (head != nullptr && head->type == FI_COND_ATIME && head->orNext == nullptr) {
        head = head->andNext;
    }
    if (head == nullptr) {
        return nullptr;
    }
    const auto found = copied->find(head);
    if (found != copied->end()) {
        return found->second;
    }
    out->push_back(*head);
    __tag_FI_SQL_COND *copy = &out->back();
    copied->emplace(head, copy);
    copy->andNext = WithoutAccessTimes(head->andNext, out, copied);
    copy->orNext = WithoutAccessTimes(head->orNext, out, copied);
    return copy;
}

}  // namespace

bool NvoSearchWalker::WalkDB(const std::string &volume, const std::vector<PathInfo> &folders,
                             const std::vector<FindATimeComp *> &extra) {
    return norvo::Guarded(false, [&] {
        const int admin = QUIBGroupIsAdminGroupMem(user.c_str());
        if (admin < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d QUIBGroupIsAdminGroupMem(%s) failed. [0x%04X %s:%d]", user.c_str(),
                    static_cast<unsigned>(VLIBCErrGet()), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return false;
        }
        std::deque<__tag_FI_SQL_COND> folderConds;
        for (const PathInfo &info : folders) {
            std::string root, rest;
            switch (norvo::search::SplitRealPath(info.fullPath, &root, &rest)) {
                case norvo::search::SplitResult::kNoShare:
                    NVO_LOG(kNorvoSearch, "%s:%d Can't find volume name %s", info.fullPath.c_str());
                    return false;
                case norvo::search::SplitResult::kNoPath:
                    // The share's top: the path has nothing below the share.
                    if (info.fullPath.back() == '/') {
                        NVO_LOG(kNorvoSearch, "%s:%d Fail to find the share name %s from %s",
                                info.shareName.c_str(), info.fullPath.c_str());
                        return false;
                    }
                    rest.clear();
                    break;
                case norvo::search::SplitResult::kOk:
                    break;
            }
            folderConds.emplace_back();
            setSqlCond(folderConds.back(), FI_COND_PATH, FI_OP_PATH_LIKE, norvo::search::BelowPattern(rest),
                       nullptr, nullptr);
        }
        // Below any chosen folder; which share, and how deep, the row filter decides: in a chain
        // an exclusion of one folder would also apply to the rows of every other.
        for (size_t i = 1; i < folderConds.size(); ++i) {
            folderConds[i - 1].orNext = &folderConds[i];
        }
        FilterContext ctx;
        ctx.extra = extra;
        for (FindComp *cond : conds) {  // the index leaves access times to the filter
            auto *atime = dynamic_cast<FindATimeComp *>(cond);
            if (atime != nullptr && std::find(ctx.extra.begin(), ctx.extra.end(), atime) == ctx.extra.end()) {
                ctx.extra.push_back(atime);
            }
        }
        ctx.folders = &folders;
        ctx.currentDirOnly = searchCurrentDir;
        ctx.admin = admin == 1;
        std::deque<__tag_FI_SQL_COND> indexConds;
        std::map<const __tag_FI_SQL_COND *, __tag_FI_SQL_COND *> copied;
        const __tag_FI_SQL_COND *where = WithoutAccessTimes(firstCond, &indexConds, &copied);
        // A search with conditions reports regular files and folders only, as a walk does.
        const FI_TABLE_GEN_CONTEXT table{dbPath.c_str(), &ctx, conds.empty() && extra.empty() ? 0 : 1};
        if (FILEIDXResultGetAndTableGen(volume.c_str(), where,
                                        folderConds.empty() ? nullptr : &folderConds.front(), KeepRow,
                                        &table) < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d Fail to query data from DB in share %s",
                    folders.empty() ? "" : folders.front().userPath.c_str());
            return false;
        }
        return true;
    });
}

}  // namespace FileSearch
