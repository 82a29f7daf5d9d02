// Looking up the account a command asks about.
#pragma once
#include <string>

#include "command.h"
#include "records.h"

namespace norvo::cli {

// The account's record; null after reporting the failure (403 for an unknown account), with
// *status set to the exit status.
UserRecord RequireUser(const Invocation &inv, const std::string &name, int *status);

// A note on stderr when no account has this name: the library answers for any name, and a
// typing error would otherwise pass for "no privilege".
void WarnIfUnknownUser(const std::string &name);

}  // namespace norvo::cli
