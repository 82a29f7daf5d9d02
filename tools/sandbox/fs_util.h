// File helpers of the sandbox. Every failure is fatal (Fail): a half-built appliance would make
// a test pass or fail for the wrong reason.
#pragma once

#include <sys/types.h>

#include <string>

namespace norvo::testing::internal {

// Creates path's missing parents as root:root 0755 (existing ones are left alone).
void MakeParents(const std::string &path);
// Creates the directory path (parents as MakeParents) or keeps the existing one, then gives it
// uid, gid and exactly mode (the umask does not apply).
void MakeDirectory(const std::string &path, uid_t uid, gid_t gid, mode_t mode);
// Replaces path's content (parents as MakeParents), then gives it uid, gid and exactly mode.
// Ownership and mode are only changed when they differ, so a FAT mount that refuses chown still
// takes root-owned files.
void WriteWholeFile(const std::string &path, const std::string &content, uid_t uid, gid_t gid, mode_t mode);
// The whole content of path; false when it can't be read.
[[nodiscard]] bool ReadWholeFile(const std::string &path, std::string *content);

}  // namespace norvo::testing::internal
