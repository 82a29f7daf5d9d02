// Small helpers shared by modules.
#pragma once
#include <string.h>

namespace norvo {

// printf's "%s" of a null pointer, spelled out so it is defined behaviour.
inline const char *OrNull(const char *s) {
    return s != nullptr ? s : "(null)";
}

inline bool IsEmpty(const char *s) {
    return s == nullptr || s[0] == '\0';
}

// Account kinds are told by the name: a backslash marks a domain account, an "@" (and no
// backslash) a directory-service account.
inline bool IsDomainUser(const char *user) {
    return strchr(user, '\\') != nullptr;
}
inline bool IsDirectoryUser(const char *user) {
    return !IsDomainUser(user) && strchr(user, '@') != nullptr;
}

}  // namespace norvo
