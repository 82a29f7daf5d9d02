// Mounts an appliance can gain after it is built: volumes, read-only remounts, a FAT disk and
// a network share whose server is gone.
#pragma once

#include <string>

#include "child_process.h"

namespace norvo::testing::internal {

// A fresh tmpfs volume (root:root 0755) at path.
void MountVolume(const std::string &path);
// Makes path read-only: the mount on it when it is a mount point, else a bind of it onto itself.
void RemountReadOnly(const std::string &path);
// A new FAT image on the sandbox's state directory, served by fusefat at path (created when
// missing), writable by everyone. Returns the server, to be owned until the appliance goes.
[[nodiscard]] ChildProcess MountFat(const std::string &path);
// The dead-remote FUSE server at path (created when missing). Returns the server.
[[nodiscard]] ChildProcess MountDeadRemote(const std::string &path);

// The type of the mount at mount point path ("" when none), from /proc/self/mounts; the last
// one wins, as it is the one on top.
std::string MountTypeAt(const std::string &path);

}  // namespace norvo::testing::internal
