// One handler per subcommand; each returns the exit status. The table is in commands.cc.
#pragma once
#include "command.h"

namespace norvo::cli {

int RunResolve(const Invocation &inv);     // cmd_paths.cc
int RunCheckName(const Invocation &inv);   // cmd_paths.cc
int RunCheckPath(const Invocation &inv);   // cmd_paths.cc
int RunPrivilege(const Invocation &inv);   // cmd_privilege.cc
int RunShares(const Invocation &inv);      // cmd_shares.cc
int RunLogin(const Invocation &inv);       // cmd_login.cc
int RunMounts(const Invocation &inv);      // cmd_enum.cc
int RunWhois(const Invocation &inv);       // cmd_enum.cc
int RunConditions(const Invocation &inv);  // cmd_conditions.cc
int RunLs(const Invocation &inv);          // cmd_ls.cc
int RunWalk(const Invocation &inv);        // cmd_walk.cc
int RunSubdirs(const Invocation &inv);     // cmd_subdirs.cc
int RunTasks(const Invocation &inv);       // cmd_tasks.cc
int RunSearchDb(const Invocation &inv);    // cmd_search_db.cc
int RunUpload(const Invocation &inv);      // cmd_upload.cc
int RunXferlog(const Invocation &inv);     // cmd_upload.cc
int RunIndex(const Invocation &inv);       // cmd_index.cc

// cmd_search.cc
int RunSearch(const Invocation &inv);
int RunSearchResults(const Invocation &inv);

}  // namespace norvo::cli
