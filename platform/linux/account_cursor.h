// The step shared by the user and group database cursors: both walk a snapshot and deliver only
// the entries whose kind of account, told by the name, the caller selected.
#pragma once
#include <stddef.h>

#include <string>
#include <vector>

#include "api_guard.h"
#include "quib_user.h"

namespace norvo::platform {

// A type without any of the three kinds would select nothing; callers refuse it as a bad
// argument rather than answer "end of database".
inline bool SelectsAnyKind(AUTH_TYPE type) {
    return (static_cast<int>(type) & AUTH_ALL) != 0;
}

// Moves *next past unselected entries and delivers the first selected one: 0 with *out
// replaced by make(entry, kind) and the previous record released with release; 1 at the end;
// -1 when make fails (slot set by make), *out and *next untouched so the entry is offered again.
template <typename Entry, typename Record, typename Make, typename Release>
int CursorStep(const std::vector<Entry> &entries, size_t *next, Record **out, AUTH_TYPE type, Make make,
               Release release) {
    while (*next < entries.size()) {
        const Entry &entry = entries[*next];
        const AUTH_TYPE kind = QUIBUserAuthTypeOf(entry.name.c_str());
        if ((kind & type) == 0) {
            ++*next;
            continue;
        }
        auto record = make(entry, kind);
        if (!record) {
            return -1;
        }
        ++*next;
        release(*out);
        *out = record.release();
        return 0;
    }
    return 1;
}

}  // namespace norvo::platform
