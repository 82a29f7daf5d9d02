#include "appliance.h"

#include <fcntl.h>
#include <sched.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <memory>

#include "accounts.h"
#include "child_process.h"
#include "extra_mounts.h"
#include "fail.h"
#include "fs_util.h"
#include "identity.h"
#include "private_root.h"
#include "settings_files.h"
#include "syslog_capture.h"
#include "unique_fd.h"

#include "quib_paths.h"

#include <sqlite3.h>

namespace norvo::testing {

using namespace internal;

namespace {

// RunAs's result travels as an exit status: -100..100 shifted into 28..228, so the statuses a
// failing child produces on its own (1, 127, ...) can't be mistaken for a result.
constexpr int kResultLimit = 100;
constexpr int kResultBias = 128;

// Only "files": the host may also list systemd or sss, which would answer with host accounts.
constexpr const char kNsswitch[] =
    "passwd: files\ngroup: files\nshadow: files\ngshadow: files\n"
    "hosts: files dns\nnetworks: files\nprotocols: files\nservices: files\n"
    "ethers: files\nrpc: files\nnetgroup: files\n";

const char *YesNo(bool value) {
    return value ? "yes" : "no";
}

// How long the destructor waits for the process's other threads to let go of its file-system
// context.
constexpr int kReturnMilliseconds = 10000;

// Whether an appliance is alive in this process: a second one would be built inside it.
bool g_applianceAlive = false;

// setns refuses (EINVAL) while another thread shares the file-system context, and a thread
// just joined may still hold it: the kernel wakes the joiner before the thread has let go.
void ReturnToNamespace(int ns, const std::string &cwd) {
    for (int waited = 0; setns(ns, CLONE_NEWNS) != 0; ++waited) {
        if (errno != EINVAL || waited >= kReturnMilliseconds)
            FailErrno("can't return to the host's mount namespace (is a thread still running?)");
        timespec delay{0, 1000000L};
        nanosleep(&delay, nullptr);
    }
    if (chdir(cwd.c_str()) != 0 && chdir("/") != 0)
        FailErrno("can't enter / on the host");
}

}  // namespace

struct Appliance::Impl {
    UniqueFd hostNamespace;
    std::string hostCwd;
    Accounts accounts;
    KeyValueFile settings{QUIB_INFO_CONF};
    KeyValueFile defaults{QUIB_INFO_DEFAULTS_CONF};
    KeyValueFile privileges{QUIB_APP_PRIVILEGE_CONF};
    ShareFile shares;
    std::unique_ptr<SyslogCapture> capture;
    std::vector<ChildProcess> servers;

    void Owner(const std::string &owner, uid_t *uid, gid_t *gid) const {
        const size_t colon = owner.find(':');
        const std::string user = owner.substr(0, colon);
        if (!accounts.FindUser(user, uid, gid))
            Fail("unknown owner %s", user.c_str());
        if (colon != std::string::npos && !accounts.FindGroup(owner.substr(colon + 1), gid))
            Fail("unknown group %s", owner.substr(colon + 1).c_str());
    }
};

Appliance::Appliance() : impl_(new Impl) {
    if (g_applianceAlive)
        Fail("one appliance at a time: the previous one is still alive");
    g_applianceAlive = true;
    impl_->hostNamespace = UniqueFd(open("/proc/self/ns/mnt", O_RDONLY | O_CLOEXEC));
    if (!impl_->hostNamespace)
        FailErrno("can't open the current mount namespace");
    char cwd[PATH_MAX];
    impl_->hostCwd = getcwd(cwd, sizeof cwd) != nullptr ? cwd : "/";

    EnterPrivateRoot({NORVO_SOURCE_DIR, NORVO_BINARY_DIR});
    WriteWholeFile("/etc/nsswitch.conf", kNsswitch, 0, 0, 0644);
    impl_->accounts.Write();
    for (KeyValueFile *file : {&impl_->settings, &impl_->defaults, &impl_->privileges})
        file->Write();
    impl_->shares.Write();
    impl_->capture = std::make_unique<SyslogCapture>("/dev/log");
    // glibc keeps its syslog socket connected; the next line must connect to the capture.
    closelog();
}

Appliance::~Appliance() {
    impl_->servers.clear();
    impl_->capture.reset();
    closelog();
    ReturnToNamespace(impl_->hostNamespace.get(), impl_->hostCwd);
    delete impl_;
    g_applianceAlive = false;
}

Appliance &Appliance::Basic() {
    AddAdmin("admin");
    for (const char *name : {"alice", "bob"}) {
        UserSpec user;
        user.name = name;
        user.groups = {"staff"};
        AddUser(user);
    }
    ShareSpec share;
    share.name = "public";
    share.readWrite = "@users";
    AddShare(share);
    share = ShareSpec();
    share.name = "photo";
    share.readWrite = "alice";
    share.readOnly = "bob";
    AddShare(share);
    share = ShareSpec();
    share.name = "secret";
    share.noAccess = "bob";
    share.readWrite = "alice";
    share.encrypted = true;
    AddShare(share);
    return SetHomeService(true);
}

Appliance &Appliance::AddUser(const UserSpec &user) {
    impl_->accounts.AddUser(user);
    impl_->accounts.Write();
    return *this;
}

Appliance &Appliance::AddGroup(const GroupSpec &group) {
    impl_->accounts.AddGroup(group);
    impl_->accounts.Write();
    return *this;
}

Appliance &Appliance::AddAdmin(const std::string &name) {
    UserSpec user;
    user.name = name;
    user.groups = {QUIB_ADMIN_GROUP};
    return AddUser(user);
}

Appliance &Appliance::AddShare(const ShareSpec &share) {
    const std::string path = impl_->shares.Add(share);
    MakeDirectory(path, 0, 0, 0777);
    return *this;
}

Appliance &Appliance::SetHomeService(bool enabled, const std::string &root, bool domain, bool directory) {
    impl_->settings.Set("userHomeEnable", YesNo(enabled));
    impl_->settings.Set("domainUserHomeEnable", YesNo(enabled && domain));
    impl_->settings.Set("ldapUserHomeEnable", YesNo(enabled && directory));
    impl_->settings.Set("userHomeRoot", root);
    impl_->accounts.SetHomesRoot(root);
    impl_->accounts.Write();
    // The appliance creates the homes folder when the service is switched on; homes are not.
    if (enabled)
        MakeDirectory(root, 0, 0, 0755);
    return *this;
}

Appliance &Appliance::SetDomain(const std::string &workgroup) {
    impl_->settings.Set("workgroup", workgroup);
    impl_->settings.Set("domain_joined", "yes");
    return *this;
}

Appliance &Appliance::SetDirectory(const std::string &server) {
    impl_->settings.Set("ldap_server", server);
    impl_->settings.Set("ldap_enabled", "yes");
    return *this;
}

Appliance &Appliance::SetSetting(const std::string &key, const std::string &value) {
    impl_->settings.Set(key, value);
    return *this;
}

Appliance &Appliance::SetDefaultSetting(const std::string &key, const std::string &value) {
    impl_->defaults.Set(key, value);
    return *this;
}

Appliance &Appliance::SetAppPrivilege(const std::string &privilege, const std::string &holders) {
    impl_->privileges.Set(privilege, holders);
    return *this;
}

Appliance &Appliance::AddSharingLink(const SharingLinkSpec &link) {
    MakeDirectory("/usr/quib/etc/filebrowser", 0, 0, 0755);
    sqlite3 *db = nullptr;
    const std::string file = "/usr/quib/etc/filebrowser/fbsharing.db";
    const std::string name = link.path.substr(link.path.rfind('/') + 1);
    char *sql = sqlite3_mprintf(
        "CREATE TABLE IF NOT EXISTS sharingLinks (linkID TEXT PRIMARY KEY, uid TEXT, filepath TEXT, "
        "filename TEXT, password TEXT, AvailDate TEXT, ExpDate TEXT);"
        "INSERT OR REPLACE INTO sharingLinks VALUES (%Q, '%u', %Q, %Q, '', %Q, %Q);",
        link.id.c_str(), static_cast<unsigned>(Uid(link.owner)), link.path.c_str(), name.c_str(),
        link.availDate.c_str(), link.expDate.c_str());
    if (sql == nullptr || sqlite3_open(file.c_str(), &db) != SQLITE_OK ||
        sqlite3_exec(db, sql, nullptr, nullptr, nullptr) != SQLITE_OK || chmod(file.c_str(), 0644) != 0) {
        Fail("can't add sharing link %s", link.id.c_str());
    }
    sqlite3_free(sql);
    sqlite3_close(db);
    return *this;
}

Appliance &Appliance::WriteFile(const std::string &path, const std::string &content, const std::string &owner,
                                mode_t mode) {
    uid_t uid;
    gid_t gid;
    impl_->Owner(owner, &uid, &gid);
    WriteWholeFile(path, content, uid, gid, mode);
    return *this;
}

Appliance &Appliance::MakeDir(const std::string &path, const std::string &owner, mode_t mode) {
    uid_t uid;
    gid_t gid;
    impl_->Owner(owner, &uid, &gid);
    MakeDirectory(path, uid, gid, mode);
    return *this;
}

Appliance &Appliance::AddVolume(const std::string &path) {
    MountVolume(path);
    return *this;
}

Appliance &Appliance::RemountReadOnly(const std::string &path) {
    internal::RemountReadOnly(path);
    return *this;
}

Appliance &Appliance::MountFat(const std::string &path) {
    impl_->servers.push_back(internal::MountFat(path));
    return *this;
}

Appliance &Appliance::MountDeadRemote(const std::string &path) {
    impl_->servers.push_back(internal::MountDeadRemote(path));
    return *this;
}

std::vector<LogLine> Appliance::Logs() {
    return impl_->capture->Lines();
}

void Appliance::ClearLogs() {
    impl_->capture->Clear();
}

void Appliance::ForwardLogs(std::function<void(const LogLine &)> sink) {
    impl_->capture->SetSink(std::move(sink));
}

std::vector<std::string> Appliance::ErrorLines() {
    std::vector<std::string> errors;
    for (const LogLine &line : Logs())
        if (line.priority == LOG_ERR)
            errors.push_back(NormaliseSourceLines(line.text));
    return errors;
}

int Appliance::RunAs(const std::string &user, const std::function<int()> &fn) {
    uid_t uid;
    gid_t gid;
    if (!impl_->accounts.FindUser(user, &uid, &gid))
        Fail("RunAs: no user %s in the appliance", user.c_str());
    fflush(nullptr);
    const pid_t pid = fork();
    if (pid < 0)
        FailErrno("RunAs: can't fork");
    if (pid == 0) {
        BecomeUser(user);
        const int result = std::clamp(fn(), -kResultLimit, kResultLimit);
        fflush(nullptr);
        _exit(result + kResultBias);
    }
    int status = 0;
    while (waitpid(pid, &status, 0) < 0) {
        if (errno != EINTR)
            FailErrno("RunAs: can't wait for the child");
    }
    if (WIFSIGNALED(status))
        return -1000 - WTERMSIG(status);
    const int code = WEXITSTATUS(status);
    if (code < kResultBias - kResultLimit || code > kResultBias + kResultLimit)
        Fail("RunAs: the child as %s exited with status %d without returning a result", user.c_str(), code);
    return code - kResultBias;
}

uid_t Appliance::Uid(const std::string &user) const {
    uid_t uid;
    gid_t gid;
    if (!impl_->accounts.FindUser(user, &uid, &gid))
        Fail("Uid: no user %s in the appliance", user.c_str());
    return uid;
}

gid_t Appliance::Gid(const std::string &group) const {
    gid_t gid;
    if (!impl_->accounts.FindGroup(group, &gid))
        Fail("Gid: no group %s in the appliance", group.c_str());
    return gid;
}

}  // namespace norvo::testing
