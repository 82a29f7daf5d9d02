// Checks shared by the file-system calls on the path arguments they are given.
#pragma once
#include <string>

namespace norvo::platform {

// 0 when path may be handed to the kernel; otherwise the errno that describes it: EINVAL for
// null or empty, ENAMETOOLONG for PATH_MAX (4096) bytes or more. Paths are byte strings, as
// the kernel takes them: bytes that are not UTF-8 are accepted.
[[nodiscard]] int CheckPathArgument(const char *path);

// The absolute, lexically normalised form of path ("." and empty components dropped, ".."
// applied without following links); a relative path is taken from the working directory.
// "" when the working directory can't be read (errno set).
[[nodiscard]] std::string AbsolutePath(const char *path);

// The directory part of a normalised absolute path: "/a/b" -> "/a", "/a" -> "/", "/" -> "/".
[[nodiscard]] std::string ParentOf(const std::string &normalized);

}  // namespace norvo::platform
