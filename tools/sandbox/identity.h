// Taking on an appliance user's identity in a child process.
#pragma once

#include <string>

namespace norvo::testing::internal {

// Makes user (looked up through NSS) the real and effective identity of the calling process:
// supplementary groups from initgroups, then gid, then uid. There is no way back. Fails
// (aborts) when the user is unknown or a step is refused.
void BecomeUser(const std::string &user);

}  // namespace norvo::testing::internal
