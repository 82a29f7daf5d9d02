// What the user and group calls share between NSS entries and the C records they hand out:
// the owning types, the record builders, and how a lookup that did not find reaches the slot.
#pragma once
#include <sys/types.h>

#include <memory>
#include <vector>

#include "api_guard.h"
#include "nss.h"
#include "quib_user.h"

namespace norvo::platform {

struct UserRecordFree {
    void operator()(PQUIBUSER user) const { QUIBUserFree(user); }
};
using UserRecord = std::unique_ptr<QUIBUSER, UserRecordFree>;

struct GroupRecordFree {
    void operator()(PQUIBGROUP group) const { QUIBGroupFree(group); }
};
using GroupRecord = std::unique_ptr<QUIBGROUP, GroupRecordFree>;

// The record QUIBUserGet and the user cursor hand out, with authType kind; null with 0x2B00
// when out of memory.
[[nodiscard]] UserRecord MakeUserRecord(const NssUser &entry, AUTH_TYPE kind);
// The record QUIBGroupGet and the group cursor hand out; null with 0x2B00 when out of memory.
[[nodiscard]] GroupRecord MakeGroupRecord(const NssGroup &entry);

// true when status is kFound; else false with the slot set: notFoundCode for kNotFound, the
// NSS failure code of err for kFailed.
[[nodiscard]] bool Found(NssStatus status, int err, int notFoundCode);

// FindUserByName for the calls that need the account to exist: false with 0x1D00 (unknown) or
// the NSS failure code.
[[nodiscard]] bool FindKnownUser(const char *name, NssUser *user);

// Looks name up (FindKnownUser) and returns use(entry), all under Guarded; -1 with the slot set
// when the account is unknown or NSS fails.
template <typename Use>
int WithKnownUser(const char *name, Use use) {
    return Guarded(-1, [&] {
        NssUser entry;
        if (!FindKnownUser(name, &entry)) {
            return -1;
        }
        return use(entry);
    });
}

// Every group id of user (GroupIdsOf); false with 0x8100 when getgrouplist fails.
[[nodiscard]] bool ListGroupIds(const NssUser &user, std::vector<gid_t> *gids);

}  // namespace norvo::platform
