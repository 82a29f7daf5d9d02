// Looking up the account a command asks about.
#pragma once
#include <memory>
#include <string>

#include "command.h"
#include "identity.h"
#include "records.h"

namespace norvo::cli {

// The account's record; null after reporting the failure (403 for an unknown account), with
// *status set to the exit status.
UserRecord RequireUser(const Invocation &inv, const std::string &name, int *status);

// The process acting as the account (its groups, gid and uid) until the result goes; null
// after reporting the failure (RequireUser's, or refusal when the identity can't be taken),
// with *status set to the exit status.
std::unique_ptr<UserIdentity> ActAsUser(const Invocation &inv, const std::string &name, int refusal,
                                        int *status);

// A note on stderr when no account has this name: the library answers for any name, and a
// typing error would otherwise pass for "no privilege".
void WarnIfUnknownUser(const std::string &name);

}  // namespace norvo::cli
