// One search over folders a user chose: the folders grouped by volume, a task database for the
// hits, and per volume either a walk of the folders or a query of the volume's index. Either
// way the hits are the same: entries the user may list, below the chosen folders, never hidden
// names nor recycle bins, never reached through a link.
//
// The search runs as the process's effective identity (the requesting user's, switched to
// beforehand); the file system's own checks decide what a walk sees, and the index's rows are
// held to the same checks. Ownership: a walker owns its directory walker and its callbacks;
// the conditions and the cancel flag stay the caller's and must outlive the walker.
#pragma once
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "fileidx.h"
#include "norvo/export.h"
#include "norvo/norvodir.h"
#include "norvo/norvosearch.h"
#include "norvo/pathinfo.h"
#include "quib_stat.h"

namespace FileSearch {

// The chosen folders by volume (ascending), each resolved once.
class NORVO_API SearchShareDirMap {
public:
    // Adds the user-visible folder. true also when the folder is skipped: the user may not
    // list its share or the folder, or it lies in a recycle bin. false (error slot set by the
    // resolution) when it can't be resolved.
    bool insertDir(const char *user, const char *context, const std::string &folder);
    // The folders of volume; null when none was chosen there.
    const std::vector<PathInfo> *findShare(const std::string &volume) const;
    bool empty() const { return dirs.empty(); }
    const std::map<std::string, std::vector<PathInfo>> &volumes() const { return dirs; }

private:
    std::map<std::string, std::vector<PathInfo>> dirs;
};

// Whether the effective identity may list the folder holding a path, asked once per folder.
class NORVO_API DirPrivilegeMap {
public:
    // The folder is path up to its last "/". Changes the working directory (the check enters
    // the folder).
    bool findDirPrivilege(const std::string &path);

private:
    std::map<std::string, bool> cache;
};

// Records each entry it is given as a hit of the task database at dbPath, through one batch
// of inserts opened at the first hit. The entry's share name comes in the walk's extra string.
class NORVO_API NvoSearchCallBack : public NvoDirectoryWalkerCallBack {
public:
    explicit NvoSearchCallBack(const char *dbPath);
    // Commits what was found (see flush).
    ~NvoSearchCallBack() override;
    NvoSearchCallBack(const NvoSearchCallBack &) = delete;
    NvoSearchCallBack &operator=(const NvoSearchCallBack &) = delete;
    // false when the hit can't be stored (the database is full or gone): the walk stops.
    bool operator()(const std::string &userPath, const std::string &basePath, const std::string &realPath,
                    const std::string &name, _tag_QUIBSTAT_ &st, const std::string *extra) override;
    // Commits the batch and closes it; false when the commit (or an insert before it) failed.
    bool flush();

private:
    struct OutputClose {
        void operator()(FI_OUTPUT_DB *db) const { FILEIDXOutputDBClose(db); }
    };
    std::string dbPath;
    std::unique_ptr<FI_OUTPUT_DB, OutputClose> output;
    std::unique_ptr<FI_FILE_INFO_DATA> record;  // one hit's record, filled anew for each
    bool failed = false;
    // Owner and group names by id, looked up once per search.
    std::map<unsigned int, std::string> userNames;
    std::map<unsigned int, std::string> groupNames;
};

// Tests each walked entry against the conditions (all must hold; with any condition, only
// regular files and directories are tested) and hands the hits to its NvoSearchCallBack.
class NORVO_API NvoSearchCompWalkerCB : public NvoDirectoryWalkerCallBack {
public:
    NvoSearchCompWalkerCB(const char *dbPath, const std::vector<FindComp *> &conds, int *cancel);
    ~NvoSearchCompWalkerCB() override;
    NvoSearchCompWalkerCB(const NvoSearchCompWalkerCB &) = delete;
    NvoSearchCompWalkerCB &operator=(const NvoSearchCompWalkerCB &) = delete;
    bool operator()(const std::string &userPath, const std::string &basePath, const std::string &realPath,
                    const std::string &name, _tag_QUIBSTAT_ &st, const std::string *extra) override;
    // Commits the hits found so far (NvoSearchCallBack::flush).
    bool flush();

private:
    std::unique_ptr<NvoSearchCallBack> hitCB;
    std::vector<FindComp *> conds;
    int *cancel;
};

class NORVO_API NvoSearchWalker {
public:
    // user and context (the login sid; "" when there is none) name the requester; cancel (may
    // be null) stays the caller's: a non-zero value there ends the search, which then counts
    // as done, keeping the hits found so far.
    NvoSearchWalker(const char *user, const char *context, int *cancel);
    ~NvoSearchWalker();
    NvoSearchWalker(const NvoSearchWalker &) = delete;
    NvoSearchWalker &operator=(const NvoSearchWalker &) = delete;

    // Maps the folders (user-visible paths) to volumes, skipping those the user may not list,
    // creates the task and its empty database on the first volume, and joins conds (at least
    // one; they must outlive the walker) into one chain. false with the platform error set:
    // 0x0300 no folder left ("Fail to find any directory" logged), else what the resolution,
    // the task folders or the database creation ("Fail to ceate DB %s") set.
    bool init(const std::vector<std::string> &folders, const std::vector<FindComp *> &conds);
    // Searches every volume in ascending order: through its index when it keeps one (extra:
    // the access-time conditions, which the index can't answer), else by walking. true when
    // done or cancelled; false with the platform error 0x0D00 (index search failed), 0x0600,
    // 0x0300, 0x8100 (a chosen folder can't be read) or 0x8000 (the walk failed, a hit could
    // not be stored included). The hits stored before a failure stay.
    bool Walk(const std::vector<FindATimeComp *> &extra);
    // The search through a volume's index; see Walk.
    bool WalkDB(const std::string &volume, const std::vector<PathInfo> &folders,
                const std::vector<FindATimeComp *> &extra);
    bool BuildDirMap(const std::vector<std::string> &folders);

    // Direct children of the chosen folders only.
    void setSearchCurrentDir(bool on) { searchCurrentDir = on; }
    const std::string &getDBVol() const { return dbVol; }
    const std::string &getDBTaskId() const { return taskId; }
    // The task database's path ("" before init).
    const std::string &getDBPath() const { return dbPath; }

private:
    std::unique_ptr<NvoDirectoryWalker> walker;
    std::unique_ptr<NvoSearchCompWalkerCB> compCB;
    int *cancel;
    bool searchCurrentDir = false;
    std::string user;
    std::string context;
    std::string taskId;
    std::string dbVol;
    __tag_FI_SQL_COND *firstCond = nullptr;
    SearchShareDirMap dirMap;
    std::string dbPath;
    std::vector<FindComp *> conds;
};

}  // namespace FileSearch
