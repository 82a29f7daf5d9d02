// What a user-visible path and a name used as one of its components may look like. Every
// resolution of a user path and every place a user name becomes a path asks here, so the
// privilege judged on a path's first component is always the privilege of the folder it lands in.
#pragma once
#include <string.h>

#include <string>

namespace norvo {

// A name that stands for exactly one directory entry: not empty, not "." or "..", no "/", no NUL
// (length counts every byte of the name, so an embedded NUL is seen).
inline bool IsPathComponent(const char *name, size_t length) {
    if (name == nullptr || length == 0 || memchr(name, '/', length) != nullptr ||
        memchr(name, '\0', length) != nullptr) {
        return false;
    }
    return !(length == 1 && name[0] == '.') && !(length == 2 && name[0] == '.' && name[1] == '.');
}
inline bool IsPathComponent(const std::string &name) {
    return IsPathComponent(name.data(), name.size());
}

// A user path begins with exactly one "/" followed by the share's name, and no component is
// "." or "..". Without the leading "/", or with two, the share that is looked up is not the one
// the tail is appended to (public/2 would become /volume1/public2); a dot component climbs out
// of the share whose privilege was judged. Empty components further on are harmless and kept.
inline bool IsWellFormedUserPath(const char *path) {
    if (path == nullptr || path[0] != '/' || path[1] == '/') {
        return false;
    }
    for (const char *start = path + 1;;) {
        const char *end = strchr(start, '/');
        const size_t length = end != nullptr ? static_cast<size_t>(end - start) : strlen(start);
        if ((length == 1 && start[0] == '.') || (length == 2 && start[0] == '.' && start[1] == '.')) {
            return false;
        }
        if (end == nullptr) {
            return true;
        }
        start = end + 1;
    }
}

// Whether a path holds a "." or ".." component (empty components are not counted).
inline bool HasDotComponent(const std::string &path) {
    for (size_t start = 0; start <= path.size();) {
        size_t end = path.find('/', start);
        if (end == std::string::npos) {
            end = path.size();
        }
        const size_t length = end - start;
        if ((length == 1 || length == 2) && path[start] == '.' && path[end - 1] == '.') {
            return true;
        }
        start = end + 1;
    }
    return false;
}

// "home", "/home" or a path below "/home/": the caller's own home, asked without a user.
inline bool IsOwnHomeName(const char *name) {
    return strcmp(name, "home") == 0 || strcmp(name, "/home") == 0 || strncmp(name, "/home/", 6) == 0;
}

}  // namespace norvo
