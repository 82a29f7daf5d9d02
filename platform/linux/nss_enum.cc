#include "nss_enum.h"

#include <errno.h>
#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include "api_guard.h"

namespace norvo::platform {
namespace {

// The bounds of nss.cc's lookups: a record past 16 MiB counts as a broken database.
constexpr size_t kInitialBuffer = 4096;
constexpr size_t kMaxBuffer = 16u << 20;
constexpr int kMaxInterruptRetries = 8;

// Runs next(record, buffer, size, &result) until the end of the database. ERANGE offers the
// same entry again once the buffer is bigger, so growing and retrying loses nothing. glibc ends
// with ENOENT; a module may also end with 0 and a null result.
template <typename Record, typename Next, typename Keep>
bool Enumerate(Next next, Keep keep, int *err) {
    std::vector<char> buffer(kInitialBuffer);
    int interrupts = 0;
    for (;;) {
        Record record{};
        Record *result = nullptr;
        const int rc = next(&record, buffer.data(), buffer.size(), &result);
        if (rc == 0 && result != nullptr) {
            keep(*result);
            continue;
        }
        if (rc == 0 || rc == ENOENT) {
            return true;
        }
        if (rc == ERANGE && buffer.size() < kMaxBuffer) {
            buffer.resize(buffer.size() * 2);
            continue;
        }
        if (rc == EINTR && ++interrupts < kMaxInterruptRetries) {
            continue;
        }
        *err = rc;
        return false;
    }
}

}  // namespace

bool EnumerateUsers(std::vector<NssUser> *users, int *err) {
    setpwent();
    ScopeExit end([] { endpwent(); });
    return Enumerate<passwd>(
        getpwent_r,
        [users](const passwd &pw) {
            NssUser user;
            user.name = pw.pw_name != nullptr ? pw.pw_name : "";
            user.uid = pw.pw_uid;
            user.gid = pw.pw_gid;
            user.gecos = pw.pw_gecos != nullptr ? pw.pw_gecos : "";
            user.home = pw.pw_dir != nullptr ? pw.pw_dir : "";
            user.shell = pw.pw_shell != nullptr ? pw.pw_shell : "";
            users->push_back(std::move(user));
        },
        err);
}

bool EnumerateGroups(std::vector<NssGroup> *groups, int *err) {
    setgrent();
    ScopeExit end([] { endgrent(); });
    return Enumerate<group>(
        getgrent_r,
        [groups](const group &gr) {
            NssGroup entry;
            entry.name = gr.gr_name != nullptr ? gr.gr_name : "";
            entry.gid = gr.gr_gid;
            for (char **member = gr.gr_mem; member != nullptr && *member != nullptr; ++member) {
                entry.members.emplace_back(*member);
            }
            groups->push_back(std::move(entry));
        },
        err);
}

}  // namespace norvo::platform
