// Path argument checks of the file-system calls.
#include "fs_path.h"

#include <errno.h>
#include <limits.h>
#include <string.h>
#include <unistd.h>

#include <memory>

#include "text_util.h"
#include "vlibc_err.h"

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

bool SplitLastComponent(std::string_view path, std::string *parent, std::string_view *last) {
    const size_t end = path.find_last_not_of('/');
    if (end == std::string_view::npos) {
        return false;
    }
    const size_t slash = path.rfind('/', end);
    const size_t start = slash == std::string_view::npos ? 0 : slash + 1;
    *last = path.substr(start, end - start + 1);
    if (slash == std::string_view::npos) {
        *parent = ".";
    } else {
        const size_t parentEnd = path.find_last_not_of('/', slash);
        *parent = parentEnd == std::string_view::npos ? "/" : std::string(path.substr(0, parentEnd + 1));
    }
    return true;
}

int FailWithErrno(int err, const char *file, int line) {
    VLIBCErrSetEx(VLIBCErrFromErrno(err), file, line);
    errno = err;
    return -1;
}

}  // namespace norvo::platform
