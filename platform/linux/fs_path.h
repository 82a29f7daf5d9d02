// Checks shared by the file-system calls on the path arguments they are given.
#pragma once
#include <string>
#include <string_view>

#include "vlibc_err.h"

namespace norvo::platform {

// 0 when path may be handed to the kernel; otherwise the errno that describes it: EINVAL for
// null or empty, ENAMETOOLONG for PATH_MAX (4096) bytes or more. Paths are byte strings, as
// the kernel takes them: bytes that are not UTF-8 are accepted.
[[nodiscard]] int CheckPathArgument(const char *path);

// The absolute, lexically normalised form of path ("." and empty components dropped, ".."
// applied without following links); a relative path is taken from the working directory.
// "" when the working directory can't be read (errno set).
[[nodiscard]] std::string AbsolutePath(const char *path);

// Splits path as the kernel resolves it for unlink: *parent is everything before the last
// component, links and ".." left as they are ("." when there is none, "/" for a top-level
// name), *last the component itself. false for the root (no last component).
[[nodiscard]] bool SplitLastComponent(std::string_view path, std::string *parent, std::string_view *last);

// Sets the error slot from err at file:line, leaves errno == err, and returns -1.
int FailWithErrno(int err, const char *file, int line);

}  // namespace norvo::platform

// Fails the current call with err, recording the caller's place.
#define NORVO_FAIL_ERRNO(err) ::norvo::platform::FailWithErrno((err), QUIB_SOURCE_NAME, __LINE__)

namespace norvo::platform {}  // namespace norvo::platform
