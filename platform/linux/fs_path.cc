// Path argument checks of the file-system calls.
#include "fs_path.h"

#include <errno.h>
#include <limits.h>
#include <string.h>
#include <unistd.h>

#include <memory>

#include "text_util.h"

namespace norvo::platform {

int CheckPathArgument(const char *path) {
    if (path == nullptr || path[0] == '\0') {
        return EINVAL;
    }
    if (strnlen(path, PATH_MAX) >= PATH_MAX) {
        return ENAMETOOLONG;
    }
    return 0;
}

std::string AbsolutePath(const char *path) {
    if (path[0] == '/') {
        return NormalizePath(path);
    }
    std::unique_ptr<char, decltype(&free)> cwd(getcwd(nullptr, 0), &free);
    if (!cwd) {
        return std::string();
    }
    std::string joined(cwd.get());
    joined += '/';
    joined += path;
    return NormalizePath(joined);
}

std::string ParentOf(const std::string &normalized) {
    const size_t slash = normalized.rfind('/');
    if (slash == std::string::npos || slash == 0) {
        return "/";
    }
    return normalized.substr(0, slash);
}

}  // namespace norvo::platform
