#include "nss.h"

#include <errno.h>
#include <grp.h>
#include <pwd.h>
#include <shadow.h>
#include <unistd.h>

#include <algorithm>

#include "vlibc_err.h"

namespace norvo::platform {
namespace {

// NSS records are copied out of a caller-supplied buffer; ERANGE asks for a bigger one. Past
// this size the lookup is deemed broken rather than grown further.
constexpr size_t kMaxNssBuffer = 16u << 20;
constexpr int kMaxInterruptRetries = 8;

size_t InitialBufferSize(int sysconfName) {
    long hint = sysconf(sysconfName);
    return hint > 0 && hint < 65536 ? static_cast<size_t>(hint) : 4096;
}

// Runs call(record, buffer, size, &result), growing the buffer on ERANGE. glibc reports "not
// found" as 0 with a null result; some modules use ENOENT or ESRCH for the same.
template <typename Record, typename Call>
NssStatus Lookup(Call call, Record *record, std::vector<char> *buffer, int sysconfName, int *err) {
    buffer->resize(InitialBufferSize(sysconfName));
    int interrupts = 0;
    for (;;) {
        Record *result = nullptr;
        int rc = call(record, buffer->data(), buffer->size(), &result);
        if (rc == 0) {
            return result != nullptr ? NssStatus::kFound : NssStatus::kNotFound;
        }
        if (rc == ERANGE && buffer->size() < kMaxNssBuffer) {
            buffer->resize(buffer->size() * 2);
            continue;
        }
        if (rc == EINTR && ++interrupts < kMaxInterruptRetries) {
            continue;
        }
        if (rc == ENOENT || rc == ESRCH) {
            return NssStatus::kNotFound;
        }
        if (err != nullptr) {
            *err = rc;
        }
        return NssStatus::kFailed;
    }
}

void CopyUser(const passwd &pw, NssUser *user) {
    user->name = pw.pw_name != nullptr ? pw.pw_name : "";
    user->uid = pw.pw_uid;
    user->gid = pw.pw_gid;
    user->gecos = pw.pw_gecos != nullptr ? pw.pw_gecos : "";
    user->home = pw.pw_dir != nullptr ? pw.pw_dir : "";
    user->shell = pw.pw_shell != nullptr ? pw.pw_shell : "";
}

void CopyGroup(const group &gr, NssGroup *out) {
    out->name = gr.gr_name != nullptr ? gr.gr_name : "";
    out->gid = gr.gr_gid;
    out->members.clear();
    for (char **member = gr.gr_mem; member != nullptr && *member != nullptr; ++member) {
        out->members.emplace_back(*member);
    }
}

}  // namespace

NssStatus FindUserByName(const std::string &name, NssUser *user, int *err) {
    passwd pw{};
    std::vector<char> buffer;
    NssStatus status =
        Lookup([&name](passwd *rec, char *buf, size_t size,
                       passwd **result) { return getpwnam_r(name.c_str(), rec, buf, size, result); },
               &pw, &buffer, _SC_GETPW_R_SIZE_MAX, err);
    if (status == NssStatus::kFound) {
        CopyUser(pw, user);
    }
    return status;
}

NssStatus FindUserById(uid_t uid, NssUser *user, int *err) {
    passwd pw{};
    std::vector<char> buffer;
    NssStatus status = Lookup([uid](passwd *rec, char *buf, size_t size,
                                    passwd **result) { return getpwuid_r(uid, rec, buf, size, result); },
                              &pw, &buffer, _SC_GETPW_R_SIZE_MAX, err);
    if (status == NssStatus::kFound) {
        CopyUser(pw, user);
    }
    return status;
}

NssStatus FindGroupByName(const std::string &name, NssGroup *out, int *err) {
    group gr{};
    std::vector<char> buffer;
    NssStatus status =
        Lookup([&name](group *rec, char *buf, size_t size,
                       group **result) { return getgrnam_r(name.c_str(), rec, buf, size, result); },
               &gr, &buffer, _SC_GETGR_R_SIZE_MAX, err);
    if (status == NssStatus::kFound) {
        CopyGroup(gr, out);
    }
    return status;
}

NssStatus FindGroupById(gid_t gid, NssGroup *out, int *err) {
    group gr{};
    std::vector<char> buffer;
    NssStatus status = Lookup([gid](group *rec, char *buf, size_t size,
                                    group **result) { return getgrgid_r(gid, rec, buf, size, result); },
                              &gr, &buffer, _SC_GETGR_R_SIZE_MAX, err);
    if (status == NssStatus::kFound) {
        CopyGroup(gr, out);
    }
    return status;
}

NssStatus FindShadowExpiry(const std::string &name, long *expireDay, int *err) {
    spwd sp{};
    std::vector<char> buffer;
    NssStatus status =
        Lookup([&name](spwd *rec, char *buf, size_t size,
                       spwd **result) { return getspnam_r(name.c_str(), rec, buf, size, result); },
               &sp, &buffer, _SC_GETPW_R_SIZE_MAX, err);
    if (status == NssStatus::kFound) {
        *expireDay = sp.sp_expire;
    }
    return status;
}

bool GroupIdsOf(const NssUser &user, std::vector<gid_t> *gids) {
    // getgrouplist says how many it needs when the array is short; NGROUPS_MAX bounds it.
    int count = 64;
    for (int attempt = 0; attempt < 8; ++attempt) {
        gids->resize(static_cast<size_t>(count));
        int want = count;
        if (getgrouplist(user.name.c_str(), user.gid, gids->data(), &want) >= 0) {
            gids->resize(static_cast<size_t>(want));
            return true;
        }
        count = std::max(want, count * 2);
        if (count > 1 << 20) {
            break;
        }
    }
    gids->clear();
    return false;
}

int NssFailureCode(int err) {
    return (err == EACCES || err == EPERM) ? QUIB_ERR_ACCESS_DENIED : QUIB_ERR_FAILED;
}

}  // namespace norvo::platform
