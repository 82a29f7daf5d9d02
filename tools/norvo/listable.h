// The check every command that reads a folder for a user makes first, as the file manager's
// requests do.
#pragma once
#include <string>

#include "command.h"

namespace norvo::cli {

// The real path of userPath, which user may list: resolved (NvoFullPathGet), then refused
// unless CheckShareListPrivilege allows it (407 when the check gives no code). Empty after
// reporting the failure, with *status set to the exit status.
std::string ListableRealPath(const Invocation &inv, const std::string &user, const std::string &userPath,
                             int *status);

}  // namespace norvo::cli
