#include "accounts.h"

#include <crypt.h>
#include <sys/random.h>

#include <algorithm>
#include <ctime>
#include <memory>

#include "fail.h"
#include "fs_util.h"

namespace norvo::testing::internal {

namespace {

constexpr uid_t kFirstUid = 1026;
constexpr gid_t kFirstGid = 65537;
constexpr gid_t kUsersGid = 100;
constexpr gid_t kAdministratorsGid = 101;
constexpr uid_t kNobody = 65534;

// A SHA-512 crypt hash with a fresh salt, as the appliance stores passwords.
std::string HashPassword(const std::string &password) {
    static const char kAlphabet[] = "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
    unsigned char random[16];
    if (getrandom(random, sizeof random, 0) != ssize_t(sizeof random))
        FailErrno("can't get a salt");
    std::string salt = "$6$";
    for (unsigned char byte : random)
        salt += kAlphabet[byte & 63];
    const auto data = std::make_unique<crypt_data>();
    const char *hash = crypt_r(password.c_str(), salt.c_str(), data.get());
    if (hash == nullptr || hash[0] == '*')
        Fail("crypt refused to hash a password");
    return hash;
}

void CheckName(const std::string &name, const char *what) {
    if (name.empty() || name.find_first_of(":\n,") != std::string::npos)
        Fail("bad %s name \"%s\"", what, name.c_str());
}

std::string Join(const std::vector<std::string> &items) {
    std::string out;
    for (const auto &item : items)
        out += (out.empty() ? "" : ",") + item;
    return out;
}

}  // namespace

Accounts::Accounts() {
    users_.push_back({"root", 0, 0, "", "/root", "/bin/sh", -1});
    users_.push_back({"nobody", kNobody, kNobody, "*", "/nonexistent", "/usr/sbin/nologin", -1});
    groups_.push_back({"root", 0, {}});
    groups_.push_back({"users", kUsersGid, {}});
    groups_.push_back({"administrators", kAdministratorsGid, {}});
    groups_.push_back({"nogroup", kNobody, {}});
}

Accounts::Group *Accounts::FindGroupEntry(const std::string &name) {
    for (auto &group : groups_)
        if (group.name == name)
            return &group;
    return nullptr;
}

Accounts::Group &Accounts::EnsureGroup(const std::string &name, gid_t gid) {
    CheckName(name, "group");
    if (Group *existing = FindGroupEntry(name)) {
        if (gid != 0 && existing->gid != gid)
            Fail("group %s already exists with gid %u, not %u", name.c_str(), unsigned(existing->gid),
                 unsigned(gid));
        return *existing;
    }
    if (gid == 0)
        gid = NextGid();
    for (const auto &group : groups_)
        if (group.gid == gid)
            Fail("gid %u is already taken by group %s", unsigned(gid), group.name.c_str());
    groups_.push_back({name, gid, {}});
    return groups_.back();
}

uid_t Accounts::NextUid() const {
    uid_t uid = kFirstUid;
    while (std::any_of(users_.begin(), users_.end(), [&](const User &u) { return u.uid == uid; }))
        ++uid;
    return uid;
}

gid_t Accounts::NextGid() const {
    gid_t gid = kFirstGid;
    while (std::any_of(groups_.begin(), groups_.end(), [&](const Group &g) { return g.gid == gid; }))
        ++gid;
    return gid;
}

void Accounts::AddUser(const UserSpec &account) {
    CheckName(account.name, "user");
    uid_t ignoredUid;
    gid_t ignoredGid;
    if (FindUser(account.name, &ignoredUid, &ignoredGid))
        Fail("user %s already exists", account.name.c_str());
    const uid_t uid = account.uid != 0 ? account.uid : NextUid();
    for (const auto &user : users_)
        if (user.uid == uid)
            Fail("uid %u is already taken by %s", unsigned(uid), user.name.c_str());
    if (account.home.find_first_of(":\n") != std::string::npos)
        Fail("bad home \"%s\"", account.home.c_str());
    users_.push_back({account.name, uid, kUsersGid, HashPassword(account.password), account.home, "/bin/sh",
                      account.expireDay});
    // Every local account of the appliance is listed in "users" as well as having it as primary.
    for (const std::string &name : [&] {
             std::vector<std::string> all{"users"};
             all.insert(all.end(), account.groups.begin(), account.groups.end());
             return all;
         }()) {
        Group &group = EnsureGroup(name, 0);
        if (std::find(group.members.begin(), group.members.end(), account.name) == group.members.end())
            group.members.push_back(account.name);
    }
}

void Accounts::AddGroup(const GroupSpec &account) {
    Group &group = EnsureGroup(account.name, account.gid);
    for (const auto &member : account.members) {
        CheckName(member, "member");
        if (std::find(group.members.begin(), group.members.end(), member) == group.members.end())
            group.members.push_back(member);
    }
}

void Accounts::SetHomesRoot(const std::string &root) {
    homesRoot_ = root;
}

bool Accounts::FindUser(const std::string &name, uid_t *uid, gid_t *gid) const {
    for (const auto &user : users_) {
        if (user.name == name) {
            *uid = user.uid;
            *gid = user.gid;
            return true;
        }
    }
    return false;
}

bool Accounts::FindGroup(const std::string &name, gid_t *gid) const {
    for (const auto &group : groups_) {
        if (group.name == name) {
            *gid = group.gid;
            return true;
        }
    }
    return false;
}

std::string Accounts::HomeOf(const User &user) const {
    return user.home.empty() ? homesRoot_ + "/" + user.name : user.home;
}

void Accounts::Write() const {
    const long today = long(time(nullptr) / 86400);
    std::string passwd, shadow, group, gshadow;
    for (const auto &user : users_) {
        passwd += user.name + ":x:" + std::to_string(user.uid) + ":" + std::to_string(user.gid) + ":" +
                  user.name + ":" + HomeOf(user) + ":" + user.shell + "\n";
        const std::string expire = user.expireDay < 0 ? "" : std::to_string(user.expireDay);
        shadow += user.name + ":" + (user.hash.empty() ? "*" : user.hash) + ":" + std::to_string(today) +
                  ":0:99999:7::" + expire + ":\n";
    }
    for (const auto &entry : groups_) {
        group += entry.name + ":x:" + std::to_string(entry.gid) + ":" + Join(entry.members) + "\n";
        gshadow += entry.name + ":!::" + Join(entry.members) + "\n";
    }
    WriteWholeFile("/etc/passwd", passwd, 0, 0, 0644);
    WriteWholeFile("/etc/group", group, 0, 0, 0644);
    WriteWholeFile("/etc/shadow", shadow, 0, 0, 0600);
    WriteWholeFile("/etc/gshadow", gshadow, 0, 0, 0600);
}

}  // namespace norvo::testing::internal
