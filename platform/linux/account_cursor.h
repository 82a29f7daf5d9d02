// What the user and group database cursors share: both walk a snapshot taken at Open and
// deliver only the entries whose kind of account, told by the name, the caller selected.
#pragma once
#include <stddef.h>

#include <memory>
#include <string>
#include <vector>

#include "api_guard.h"
#include "nss.h"
#include "quib_user.h"

namespace norvo::platform {

// The state behind a QUIBUSER_DB or QUIBGROUP_DB: the entries NSS enumerated at Open and the
// index of the next one a step looks at.
template <typename Entry>
struct AccountSnapshot {
    std::vector<Entry> entries;
    size_t next = 0;
};

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

// Open: a new Db holding what enumerate took; null with the NSS failure code when it fails.
template <typename Db, typename Entry>
Db *OpenSnapshot(bool (*enumerate)(std::vector<Entry> *, int *)) {
    return Guarded<Db *>(nullptr, [&] {
        auto db = std::make_unique<Db>();
        int err = 0;
        if (!enumerate(&db->entries, &err)) {
            QUIB_SET_ERR(NssFailureCode(err));
            return static_cast<Db *>(nullptr);
        }
        return db.release();
    });
}

// GetByCursor: CursorStep over db, after refusing a null db or out, or a type that selects
// nothing, with 0x0D00.
template <typename Db, typename Record, typename Make, typename Release>
int StepSnapshot(Db *db, Record **out, AUTH_TYPE type, Make make, Release release) {
    if (db == nullptr || out == nullptr || !SelectsAnyKind(type)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return Guarded(-1, [&] { return CursorStep(db->entries, &db->next, out, type, make, release); });
}

}  // namespace norvo::platform
