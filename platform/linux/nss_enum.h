// Whole-database enumeration of users and groups through NSS (getpwent_r, getgrent_r), copied
// into snapshots, so a cursor over them never holds NSS's one per-process enumeration open.
#pragma once
#include <vector>

#include "nss.h"

namespace norvo::platform {

// Every entry NSS enumerates, in its order (duplicates kept). false with the errno of the
// failed step in *err when NSS fails or an entry would not fit in 16 MiB (ERANGE).
[[nodiscard]] bool EnumerateUsers(std::vector<NssUser> *users, int *err);
[[nodiscard]] bool EnumerateGroups(std::vector<NssGroup> *groups, int *err);

}  // namespace norvo::platform
