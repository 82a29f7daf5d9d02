// The appliance's file-system view: a private mount namespace whose root is a fresh tmpfs that
// holds the host's directories read-only, but with /etc and /usr copy-on-write, /tmp, /run,
// /etc.defaults, /dev and the volumes fresh, and the project's trees writable.
#pragma once

#include <string>
#include <vector>

namespace norvo::testing::internal {

// Where the sandbox keeps what the appliance itself must not see as data (the overlays' upper
// layers, FAT images), on the private root.
inline constexpr const char kStateDir[] = "/.norvo-sandbox";

// Moves the calling process into a new mount namespace and pivots into the private root, where
// the host's directories are read-only except the reachable trees: those are bound writable at
// their own paths, and every directory on the way is searchable by every user (trees that no
// longer exist are left out). The working directory is kept when it is still reachable, else
// it becomes "/". Fails (aborts) when any step fails; the host's mounts and files are never
// changed.
void EnterPrivateRoot(const std::vector<std::string> &reachable);

// Mounts a fresh tmpfs (root:root, mode) on path, creating path when missing.
void MountTmpfs(const std::string &path, const char *mode);

}  // namespace norvo::testing::internal
