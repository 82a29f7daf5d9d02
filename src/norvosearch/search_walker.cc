// NvoSearchWalker: one search, volume by volume, by walking or through the volume's index;
// its walker callbacks test the conditions and store the hits in one batch of inserts.
#include <errno.h>
#include <string.h>
#include <sys/stat.h>

#include <memory>
#include <new>
#include <string>
#include <vector>

#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/searchdb.h"
#include "norvo/searchwalker.h"
#include "norvosearch/search_db_record.h"
#include "quib_user.h"
#include "vlibc_err.h"

using norvo::kNorvoSearch;

namespace FileSearch {
namespace {

// Looks a name up once per search; "" when the platform does not know the id.
template <typename Record, typename Get, typename Free>
const std::string &NameOf(std::map<unsigned int, std::string> &cache, unsigned int id, Get get,
                          Free release) {
    const auto found = cache.find(id);
    if (found != cache.end()) {
        return found->second;
    }
    Record *record = nullptr;
    std::string name;
    if (get(id, &record, 0) == 0 && record != nullptr) {
        name = record->szName;
        release(record);
    }
    return cache.emplace(id, name).first->second;
}

}  // namespace

NvoSearchCallBack::NvoSearchCallBack(const char *path)
    : dbPath(path == nullptr ? "" : path), record(new (std::nothrow) FI_FILE_INFO_DATA()) {}

NvoSearchCallBack::~NvoSearchCallBack() = default;

bool NvoSearchCallBack::operator()(const std::string &, const std::string &, const std::string &realPath,
                                   const std::string &, _tag_QUIBSTAT_ &st, const std::string *extra) {
    return norvo::Guarded(false, [&] {
        if (failed || !record) {
            return false;
        }
        std::string root, rest;
        if (norvo::search::SplitRealPath(realPath, &root, &rest) != norvo::search::SplitResult::kOk) {
            return true;  // the walk hands only entries below a share's folder
        }
        if (!output) {
            FI_OUTPUT_DB *db = nullptr;
            if (FILEIDXOutputDBOpen(dbPath.c_str(), &db) != 0) {
                failed = true;
                return false;
            }
            output.reset(db);
        }
        // Every field is written below: no need to clear 14 KiB for each hit.
        norvo::search::FillHit(
            extra != nullptr ? *extra : norvo::search::KeyShare(root.substr(root.rfind('/') + 1)), root, rest,
            st, record.get());
        norvo::search::CopyText(record->userName, sizeof record->userName,
                                NameOf<QUIBUSER>(userNames, st.st_uid, QUIBUserGetByUID, QUIBUserFree));
        norvo::search::CopyText(record->groupName, sizeof record->groupName,
                                NameOf<QUIBGROUP>(groupNames, st.st_gid, QUIBGroupGetByGID, QUIBGroupFree));
        if (FILEIDXOutputDBInsert(output.get(), record.get()) != 0) {
            failed = true;
            return false;
        }
        return true;
    });
}

bool NvoSearchCallBack::flush() {
    return norvo::Guarded(false, [&] {
        const bool ok = FILEIDXOutputDBClose(output.release()) == 0 && !failed;
        failed = false;
        return ok;
    });
}

NvoSearchCompWalkerCB::NvoSearchCompWalkerCB(const char *dbPath, const std::vector<FindComp *> &list,
                                             int *flag)
    : hitCB(new NvoSearchCallBack(dbPath)), conds(list), cancel(flag) {}

NvoSearchCompWalkerCB::~NvoSearchCompWalkerCB() = default;

bool NvoSearchCompWalkerCB::operator()(const std::string &userPath, const std::string &basePath,
                                       const std::string &realPath, const std::string &name,
                                       _tag_QUIBSTAT_ &st, const std::string *extra) {
    return norvo::Guarded(false, [&] {
        // Cancelled: the walk stops before the next entry; nothing more is stored meanwhile.
        if (cancel != nullptr && __atomic_load_n(cancel, __ATOMIC_RELAXED) != 0) {
            return true;
        }
        if (!conds.empty() && !S_ISREG(st.st_mode) && !S_ISDIR(st.st_mode)) {
            return true;
        }
        for (FindComp *cond : conds) {
            if (!(*cond)(realPath.c_str(), st)) {
                return true;
            }
        }
        return (*hitCB)(userPath, basePath, realPath, name, st, extra);
    });
}

bool NvoSearchCompWalkerCB::flush() {
    return hitCB->flush();
}

NvoSearchWalker::NvoSearchWalker(const char *name, const char *ctx, int *flag)
    : cancel(flag), user(name == nullptr ? "" : name), context(ctx == nullptr ? "" : ctx) {}

NvoSearchWalker::~NvoSearchWalker() = default;

bool NvoSearchWalker::BuildDirMap(const std::vector<std::string> &folders) {
    return norvo::Guarded(false, [&] {
        if ((cancel != nullptr && *cancel != 0) || folders.empty()) {
            return true;
        }
        for (const std::string &folder : folders) {
            if (!dirMap.insertDir(user.c_str(), context.c_str(), folder)) {
                return false;
            }
            if (cancel != nullptr && *cancel != 0) {
                return true;
            }
        }
        return true;
    });
}

bool NvoSearchWalker::init(const std::vector<std::string> &folders, const std::vector<FindComp *> &list) {
    return norvo::Guarded(false, [&] {
        if (!BuildDirMap(folders)) {
            return false;
        }
        if (dirMap.empty()) {
            NVO_SET_QUIB_ERR(kNorvoSearch, QUIB_ERR_ACCESS_DENIED);
            NVO_LOG(kNorvoSearch, "%s:%d Fail to find any directory");
            return false;
        }
        dbVol = dirMap.volumes().begin()->second.front().volumePath;
        NvoSearchDBTask task(dbVol.c_str(), user.c_str(), nullptr);
        taskId = task.getDBTaskId();
        dbPath = task.getDBTaskFilePath();
        conds = list;
        walker = std::make_unique<NvoDirectoryWalker>(IGNORE_ERR_ALL, cancel);
        compCB = std::make_unique<NvoSearchCompWalkerCB>(dbPath.c_str(), conds, cancel);
        if (FILEIDXDBCreate(dbPath.c_str()) < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d Fail to ceate DB %s", dbPath.c_str());
            return false;
        }
        for (size_t i = 1; i < conds.size(); ++i) {
            (*conds[i - 1])(conds[i]);
        }
        firstCond = conds.empty() ? nullptr : conds[0]->getFirstCond();
        return true;
    });
}

bool NvoSearchWalker::Walk(const std::vector<FindATimeComp *> &extra) {
    return norvo::Guarded(false, [&] {
        if (user.empty() || context.empty() || !compCB) {
            NVO_SET_QUIB_ERR(kNorvoSearch, QUIB_ERR_BAD_PARAMETER);
            return false;
        }
        for (const auto &[volume, folders] : dirMap.volumes()) {
            if (cancel != nullptr && *cancel != 0) {
                return true;
            }
            // The index knows the shares' folders; home folders lie in none of them and are
            // walked, so that a search below /home finds what it would find without an index.
            std::vector<PathInfo> indexed, walked;
            const bool index = FILEIDXIsIndexEnable(volume.c_str()) == 1;
            for (const PathInfo &info : folders) {
                (index && info.shareName != "homes" ? indexed : walked).push_back(info);
            }
            if (!indexed.empty() && !WalkDB(volume, indexed, extra)) {
                NVO_SET_QUIB_ERR(kNorvoSearch, QUIB_ERR_BAD_PARAMETER);
                return false;
            }
            for (const PathInfo &info : walked) {
                if (cancel != nullptr && *cancel != 0) {
                    break;
                }
                struct stat st;
                if (lstat(info.fullPath.c_str(), &st) != 0) {
                    const int err = errno;
                    if (err == ENOENT) {
                        NVO_SET_QUIB_ERR(kNorvoSearch, QUIB_ERR_NO_SUCH_FILE);
                    } else if (err == EPERM || err == EACCES) {
                        NVO_SET_QUIB_ERR(kNorvoSearch, QUIB_ERR_ACCESS_DENIED);
                    } else {
                        NVO_SET_QUIB_ERR(kNorvoSearch, QUIB_ERR_FAILED);
                        NVO_LOG(kNorvoSearch, "%s:%d Fail to Stat %s, %s", info.fullPath.c_str(),
                                strerror(err));
                    }
                    compCB->flush();
                    return false;
                }
                if (!S_ISDIR(st.st_mode)) {
                    continue;
                }
                const bool done =
                    walker->Walk_FirstFolder_First(info.userPath, info.sharePath, info.fullPath, *compCB,
                                                   &info.shareName, true, searchCurrentDir);
                // What was found stays, whatever ended the walk.
                if (!compCB->flush() || !done) {
                    NVO_SET_QUIB_ERR(kNorvoSearch, QUIB_ERR_INTERNAL);
                    NVO_LOG(kNorvoSearch, "%s:%d Fail to walk %s", info.fullPath.c_str());
                    return false;
                }
            }
        }
        return true;
    });
}

}  // namespace FileSearch
