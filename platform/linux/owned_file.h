// Files a process keeps for itself in a shared directory such as /tmp (lock files, line files):
// where others can create names, a name may already be a link or someone else's file.
#pragma once
#include "locked_file.h"

namespace norvo::platform {

// Opens the absolute path with flags (O_CREAT makes it 0600) plus close-on-exec, never
// following a link in its last component, which must be one plain name (not empty, "." or
// ".."). The directories before it are resolved as usual. The file must be a regular file of
// the effective user. 0 and *fd; QUIB_ERR_BAD_PARAMETER for a null, relative or badly ended
// path; QUIB_ERR_ACCESS_DENIED for a link, another type of file or another owner; the errno's
// code otherwise (QUIB_ERR_NO_SUCH_FILE when missing and not created).
[[nodiscard]] int OpenOwnFile(const char *path, int flags, FileDescriptor *fd);

}  // namespace norvo::platform
