// The extension of a file name.
#include <string.h>

#include "norvo/norvomisc.h"

// Index 0 is never looked at, so a name whose only dot leads it (".profile") has none.
const char *ReturnFileExt(const char *name, int start) {
    if (name == nullptr) {
        return nullptr;
    }
    const size_t length = strlen(name);
    if (length < 2) {
        return nullptr;
    }
    size_t at = start > 1 && static_cast<size_t>(start) < length ? static_cast<size_t>(start) : length - 1;
    while (at > 0 && name[at] != '.') {
        --at;
    }
    if (at == 0 || name[at + 1] == '\0') {
        return nullptr;
    }
    return name + at + 1;
}
