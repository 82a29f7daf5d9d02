// A throwaway appliance for tests: a private mount namespace with tmpfs volumes, private
// settings locations, private passwd/group/shadow, and a syslog socket that captures every
// line the code under test logs. The host is read-only inside, but for the project's source and
// build trees, which every appliance user can reach; everything else vanishes with the process.
#pragma once

#include <sys/types.h>

#include <functional>
#include <ostream>
#include <string>
#include <vector>

namespace norvo::testing {

struct UserSpec {
    std::string name;                 // "alice", "CORP\\dave" (domain), "erin@corp.example" (directory)
    uid_t uid = 0;                    // 0: the next free id from 1026 up
    std::string password = "secret";  // hashed into shadow with crypt
    std::vector<std::string> groups;  // supplementary groups (created if missing); primary: "users"
    std::string home;                 // "": <homes root>/<name>
    long expireDay = -1;              // shadow expiry, days since 1970; -1 none
};

struct GroupSpec {
    std::string name;
    gid_t gid = 0;  // 0: the next free id from 65537 up
    std::vector<std::string> members;
};

struct ShareSpec {
    std::string name;
    std::string volume = "/volume1";  // the share's path is <volume>/<name> unless path is set
    std::string path;
    std::string noAccess;  // comma-separated users and @groups, as in the share configuration
    std::string readWrite;
    std::string readOnly;
    bool hidden = false;  // browseable = no
    bool encrypted = false;
    unsigned restrict = 0;  // SHARE_RESTRICT_* bits
    bool aclMode = true;
    std::string comment;
};

// A row of the sharing link database /usr/quib/etc/filebrowser/fbsharing.db.
struct SharingLinkSpec {
    std::string id;
    std::string owner;            // an appliance user; the row holds its uid
    std::string path;             // the shared folder, a user path ("/photo/2024")
    std::string availDate = "0";  // seconds since 1970, as text (any text: tests give bad ones)
    std::string expDate = "0";    // "0": never expires
};

// One captured syslog line.
struct LogLine {
    int priority;      // LOG_ERR, ...; -1 for a datagram not in syslog form (text is all of it)
    std::string text;  // the formatted message, without timestamp and ident
};

inline bool operator==(const LogLine &a, const LogLine &b) {
    return a.priority == b.priority && a.text == b.text;
}
inline bool operator!=(const LogLine &a, const LogLine &b) {
    return !(a == b);
}
// Readable in test failure messages.
inline void PrintTo(const LogLine &line, std::ostream *out) {
    *out << "{" << line.priority << ", \"" << line.text << "\"}";
}

class Appliance {
public:
    // Enters a private mount namespace and builds an empty appliance: tmpfs volumes /volume1 and
    // /volume2 (read-write), private /etc (users root and the "administrators" and "users"
    // groups), /etc.defaults, /usr/quib/etc, /tmp, and the syslog capture on /dev/log.
    // One appliance at a time per process; several in turn are fine. Aborts on failure.
    Appliance();
    // Stops the FUSE servers and returns the process to the mount namespace and working
    // directory it came from; the appliance's namespace and everything in it vanish with its
    // last process. Threads the caller started must have ended (it waits up to 10 s for them to
    // let go of the process's file-system context, then aborts).
    ~Appliance();
    Appliance(const Appliance &) = delete;
    Appliance &operator=(const Appliance &) = delete;

    // Presets: admin "admin" (password "secret"), users "alice" and "bob" in group "staff",
    // shares "public" (rw @users), "photo" (rw alice, ro bob), "secret" (no access bob,
    // rw alice, encrypted), home service on with root /volume1/homes.
    Appliance &Basic();

    Appliance &AddUser(const UserSpec &user);
    Appliance &AddUser(const std::string &name) {
        UserSpec user;
        user.name = name;
        return AddUser(user);
    }
    Appliance &AddGroup(const GroupSpec &group);
    Appliance &AddAdmin(const std::string &name);  // a user in "administrators"
    // Creates the share's directory (mode 0777, root) and its configuration section.
    Appliance &AddShare(const ShareSpec &share);
    // The home service: enabled flag for local, domain and directory accounts, and the root.
    Appliance &SetHomeService(bool enabled, const std::string &root = "/volume1/homes", bool domain = true,
                              bool directory = true);
    // Configures a domain ("CORP") or directory service so their privilege lookups work.
    Appliance &SetDomain(const std::string &workgroup);
    Appliance &SetDirectory(const std::string &server);
    // key="value" into /etc/quibinfo.conf.
    Appliance &SetSetting(const std::string &key, const std::string &value);
    // key="value" into /etc.defaults/quibinfo.conf (the factory defaults).
    Appliance &SetDefaultSetting(const std::string &key, const std::string &value);
    // Grants an application privilege to a comma-separated list of users and @groups.
    Appliance &SetAppPrivilege(const std::string &privilege, const std::string &holders);
    // Adds (or replaces) a link in the sharing link database, creating it (root, 0644).
    Appliance &AddSharingLink(const SharingLinkSpec &link);

    // Files with owner ("user", group: the user's primary; or "user:group") and exactly mode;
    // parents are created as root:root 0755 when missing. An existing file or directory is
    // overwritten or kept, and takes the owner and mode.
    Appliance &WriteFile(const std::string &path, const std::string &content = "",
                         const std::string &owner = "root", mode_t mode = 0644);
    Appliance &MakeDir(const std::string &path, const std::string &owner = "root", mode_t mode = 0755);

    // Extra mounts. A volume is a tmpfs at path; readOnly remounts it read-only after setup
    // (use MakeDir/WriteFile before, or pass readOnly later through RemountReadOnly).
    Appliance &AddVolume(const std::string &path);
    Appliance &RemountReadOnly(const std::string &path);
    // A FAT file system (FUSE, fusefat) at path, writable by everyone.
    Appliance &MountFat(const std::string &path);
    // A network file system whose server is gone: every access below path fails with EIO,
    // and the platform classes its type as remote.
    Appliance &MountDeadRemote(const std::string &path);

    // Every syslog line received so far, in order; Clear forgets them. Lines logged by any
    // process of the appliance count, whatever its identity. Call from the test's own process
    // only (not inside RunAs).
    std::vector<LogLine> Logs();
    void ClearLogs();
    // From now on each line goes to sink as it arrives (on the capture's own thread) instead of
    // being kept for Logs(); lines kept so far are passed first. For long runs (the
    // norvo-sandbox command, benchmarks).
    void ForwardLogs(std::function<void(const LogLine &)> sink);
    // The error-level lines with the source line numbers replaced by "#": "norvodir.cpp:# x" and
    // "nvoman.cpp(#) y", so tests can compare whole messages.
    std::vector<std::string> ErrorLines();

    // Runs fn in a child process whose real and effective identity is user's (initgroups,
    // setgid, setuid) and returns fn's result, which must lie in -100..100 (it travels as the
    // exit status; others are clamped to that range), or -1000 - signal when the child died
    // (an abort gives -1006). Test assertions made inside fn are lost with the child: return a
    // value and check it in the parent. Aborts when user is not an appliance user.
    int RunAs(const std::string &user, const std::function<int()> &fn);

    // The ids the appliance gave; aborts when the name is unknown.
    uid_t Uid(const std::string &user) const;
    gid_t Gid(const std::string &group) const;

private:
    struct Impl;
    Impl *impl_;
};

}  // namespace norvo::testing
