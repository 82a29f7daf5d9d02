// The chosen folders of a search by volume, and the folders whose entries the user may see.
#include <string>
#include <vector>

#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "norvo/pathinfo.h"
#include "norvo/searchwalker.h"
#include "norvosearch/search_db_record.h"
#include "norvosearch/search_scope.h"
#include "quib_share.h"

namespace FileSearch {

bool SearchShareDirMap::insertDir(const char *user, const char *context, const std::string &folder) {
    if (CheckShareListPrivilege(user, context, folder.c_str()) != 1) {
        return true;
    }
    PathInfo info;
    if (PathInfoFactory::create(user, folder, info) != 1) {
        return false;
    }
    // A folder in a bin or under a hidden name is one no walk from above would enter.
    std::string root, rest;
    const bool below =
        norvo::search::SplitRealPath(info.fullPath, &root, &rest) == norvo::search::SplitResult::kOk;
    if (QUIBShareIsShareRecycle(info.fullPath.c_str()) == 1 ||
        (below && norvo::search::OutOfSight(root, rest)) ||
        CheckDirListPrivilege(info.fullPath.c_str()) != 1) {
        return true;
    }
    if (IsDirUserHome(info.shareName, user) == 1) {
        info.shareName = "homes";
    }
    dirs[info.volumePath].push_back(info);
    return true;
}

const std::vector<PathInfo> *SearchShareDirMap::findShare(const std::string &volume) const {
    const auto found = dirs.find(volume);
    return found == dirs.end() ? nullptr : &found->second;
}

bool DirPrivilegeMap::findDirPrivilege(const std::string &path) {
    const std::string dir = path.substr(0, path.rfind('/'));
    const auto found = cache.find(dir);
    if (found != cache.end()) {
        return found->second;
    }
    const bool may = CheckDirListPrivilege(dir.c_str()) == 1;
    cache.emplace(dir, may);
    return may;
}

}  // namespace FileSearch
