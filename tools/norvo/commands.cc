// The table of subcommands: name, help and handler. A new subcommand is one entry here and
// one handler in a file of its own group.
#include "command.h"
#include "handlers.h"

namespace norvo::cli {
namespace {

constexpr char kUserHelp[] = "the account asking: a local name, DOMAIN\\name or name@realm";

std::vector<CommandDef> MakeCommands() {
    return {
        {"resolve", "where a user-visible path leads (real path, share, volume)",
         "Resolves PATH as the file manager does for USER (NvoFullPathGet): the real path, the\n"
         "share name, the volume path and the share's real path, and whether the share is\n"
         "encrypted (NvoLibCheckEncryptShare). /home/... is USER's own home\n"
         "folder, which the library creates when it is missing, as it does for every request.",
         {{"user", "USER", true, kUserHelp}},
         {{"PATH", "a user-visible path: /share/dir/file, /home/..., /homes/USER/..."}},
         RunResolve},
        {"privilege", "what a user may do at a path (share privilege, restrictions, ACL, checks)",
         "Reports for USER at PATH: the share privilege (none, read-only, read-write; 0/1/2 in\n"
         "JSON) and the share's restriction flags (no-browse 0x1, no-modify 0x2, no-download\n"
         "0x4; administrators have none), both from NvoLibGetPrivilege; the ACL mask of the\n"
         "resolved real path (GetACLPrivilege); and the verdicts of the list, download and\n"
         "upload checks. \"upload\" is asked with type 1, the share-level answer (type 2 comes\n"
         "back for a restricted share); \"upload, no overwrite\" with type 0, which also refuses\n"
         "a target that exists.\n"
         "\n"
         "The kernel judges ACLs for the effective identity, so the ACL mask is asked after\n"
         "taking USER's groups, gid and uid (initgroups, setegid, seteuid): the mask is USER's.\n"
         "That needs root (or USER's own identity). The library lets a mask it cannot read pass\n"
         "as 0x1fff (all); \"real path exists\" tells such a case apart.\n"
         "\n"
         "Domain (DOMAIN\\name) and directory (name@realm) accounts are asked through their\n"
         "service only with --sid, the sid of one of their logins (see norvo login). Home\n"
         "folders (/home/...) have no share privilege: the checks let them through.",
         {{"user", "USER", true, kUserHelp}, {"sid", "SID", false, "the login sid of a domain or directory account"}},
         {{"PATH", "a user-visible path: /share/dir/file, /home/..., /homes/USER/..."}},
         RunPrivilege},
        {"shares", "the shares a user's file manager lists",
         "Lists the visible shares USER may read, or with --writable write (NvoLibValidShareGen),\n"
         "in configuration order, or sorted case-insensitively with --sort. Hidden shares and\n"
         "shares that deny USER are left out.",
         {{"user", "USER", true, kUserHelp},
          {"writable", nullptr, false, "only the shares USER may write"},
          {"sort", nullptr, false, "sort the names case-insensitively"}},
         {},
         RunShares},
        {"check-name", "whether a name may be created in a directory",
         "Asks NvoCheckFileName whether NAME may be created in the real directory DIR: refused\n"
         "with 418 for reserved names (\".\", \"..\", a name with \":\" or \"/\", \"._...\", the\n"
         "platform's extended-attribute directories) and with 419 for characters a FAT file\n"
         "system can't hold. A refusal is a failure: exit status 1 with the code and key.",
         {},
         {{"DIR", "a real directory, e.g. /volume1/photo"}, {"NAME", "the name to create"}},
         RunCheckName},
        {"check-path", "whether a real path is acceptable before creating its missing tail",
         "Asks NvoCheckPath about the real path PATH. Without --find-existing PATH itself must\n"
         "exist; with it, the longest existing leading part is checked and printed. --mode asks\n"
         "an access test on that part (bits: 1 read, 2 write, 4 execute, 8 delete, 16 append;\n"
         "32, the default, asks none), judged for the invoking identity, or for USER with\n"
         "--user (taken as in norvo privilege). Every component must be a non-reserved name.",
         {{"find-existing", nullptr, false, "check and print the longest existing leading part"},
          {"mode", "N", false, "access request, decimal or 0x hex, 1 to 63 (default 32: none)"},
          {"user", "USER", false, "judge the access test as this account (needs root)"}},
         {{"PATH", "an absolute real path, e.g. /volume1/photo/new/dir"}},
         RunCheckPath},
        {"login", "log a user in and print the new sid",
         "Checks USER's password and records a login from the remote address, as the web\n"
         "interface does (QUIBLoginCreate), then prints the sid (alone on its line in text, so\n"
         "$(norvo login ...) takes it). Give the password with --password (visible to other\n"
         "processes: for tests and demos) or as the first line of stdin with --password-stdin.",
         {{"user", "USER", true, kUserHelp},
          {"password", "PASSWORD", false, "the password"},
          {"password-stdin", nullptr, false, "read the password from the first line of stdin"},
          {"remote-addr", "ADDR", false, "the address the login comes from (default 127.0.0.1)"}},
         {},
         RunLogin},
    };
}

}  // namespace

const std::vector<CommandDef> &Commands() {
    static const std::vector<CommandDef> commands = MakeCommands();
    return commands;
}

const CommandDef *FindCommand(const std::string &name) {
    for (const CommandDef &command : Commands()) {
        if (name == command.name) {
            return &command;
        }
    }
    return nullptr;
}

}  // namespace norvo::cli
