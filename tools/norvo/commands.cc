// The table of subcommands: name, help and handler. A new subcommand is one entry here and
// one handler in a file of its own group.
#include "command.h"
#include "handlers.h"

namespace norvo::cli {
namespace {

constexpr char kUserHelp[] = "the account asking: a local name, DOMAIN\\name or name@realm";

std::vector<CommandDef> MakeCommands() {
    return {
        {"resolve",
         "where a user-visible path leads (real path, share, volume)",
         "Resolves PATH as the file manager does for USER (NvoFullPathGet): the real path, the\n"
         "share name, the volume path and the share's real path, and whether the share is\n"
         "encrypted (NvoLibCheckEncryptShare). /home/... is USER's own home\n"
         "folder, which the library creates when it is missing, as it does for every request.",
         {{"user", "USER", true, kUserHelp}},
         {{"PATH", "a user-visible path: /share/dir/file, /home/..., /homes/USER/..."}},
         RunResolve},
        {"privilege",
         "what a user may do at a path (share privilege, restrictions, ACL, checks)",
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
         {{"user", "USER", true, kUserHelp},
          {"sid", "SID", false, "the login sid of a domain or directory account"}},
         {{"PATH", "a user-visible path: /share/dir/file, /home/..., /homes/USER/..."}},
         RunPrivilege},
        {"shares",
         "the shares a user's file manager lists",
         "Lists the visible shares USER may read, or with --writable write (NvoLibValidShareGen),\n"
         "in configuration order, or sorted case-insensitively with --sort. Hidden shares and\n"
         "shares that deny USER are left out.",
         {{"user", "USER", true, kUserHelp},
          {"writable", nullptr, false, "only the shares USER may write"},
          {"sort", nullptr, false, "sort the names case-insensitively"}},
         {},
         RunShares},
        {"check-name",
         "whether a name may be created in a directory",
         "Asks NvoCheckFileName whether NAME may be created in the real directory DIR: refused\n"
         "with 418 for reserved names (\".\", \"..\", a name with \":\" or \"/\", \"._...\", the\n"
         "platform's extended-attribute directories) and with 419 for characters a FAT file\n"
         "system can't hold. A refusal is a failure: exit status 1 with the code and key.",
         {},
         {{"DIR", "a real directory, e.g. /volume1/photo"}, {"NAME", "the name to create"}},
         RunCheckName},
        {"check-path",
         "whether a real path is acceptable before creating its missing tail",
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
        {"login",
         "log a user in and print the new sid",
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
        {"mounts",
         "the mount-status table a listing works with",
         "Reads the mount table as the library does (NorvoMountStatus, from /proc/mounts) and\n"
         "prints each mount directory with its read-only state and its file-system type: the\n"
         "index into the platform's type table and its name. Type names compare exactly with the\n"
         "table, so a mount whose type is none of its names (fuse.*, overlay, proc) is 11\n"
         "(unknown). Of several mounts on one directory the first line of the table counts, as\n"
         "for the library, even when a later mount hides it.\n"
         "\n"
         "With --path, also the answers for PATH: read-only as the deepest mount directory that is\n"
         "PATH or a parent of it says (IsReadOnly; the root mount \"/\" counts only for \"/\" itself\n"
         "and \"//...\"), and the type only when PATH, trailing slashes cut, is a mount directory\n"
         "itself (getFSTYPE; 10 otherwise, also for \"/\").",
         {{"path", "PATH", false, "also report the read-only state and type the library gives PATH"}},
         {},
         RunMounts},
        {"whois",
         "names and groups of a user or group id, through the name caches",
         "Names an id as a listing names the owner of a file (NorvoUserEnum): --uid N gives the\n"
         "account's name and its groups (NvoEnum::EnumUserGroups, the primary group first), each\n"
         "named through the group cache; --user USER the same for an account name; --gid N the\n"
         "group's name. Give exactly one of them. An id nobody has is a failure (403 for a uid,\n"
         "404 for a gid); a listing would show an empty name.",
         {{"uid", "N", false, "a user id (decimal)"},
          {"gid", "N", false, "a group id (decimal)"},
          {"user", "USER", false, kUserHelp}},
         {},
         RunWhois},
        {"conditions",
         "the search conditions a request makes, their index records, and what they match",
         "Builds the conditions a search request with these fields makes\n"
         "(FileSearch::FindFactory::createFindOp, in the order of the options below) and joins them\n"
         "into one query as the search walker does. Prints each condition with the file-index\n"
         "records it owns, then every record numbered from the first one of the query: column\n"
         "(FI_COND_*), operator (FI_OP_*), operand, and where its \"and\" link (must also hold)\n"
         "and \"or\" link (may hold instead) lead. For each FILE it reads the status (a final link\n"
         "is not followed) and tests the conditions in memory, as a walk would: \"matches\", or the\n"
         "first condition that fails.\n"
         "\n"
         "Values go to the library unchanged, quirks included: --name a,b gives two alternatives and\n"
         "a term in double quotes a condition of its own; --type words other than dir and file add\n"
         "nothing; numbers that are not numbers read as 0; time words other than \"before\" (any case)\n"
         "mean at or after; size words other than \"equal\" and \"less\" (exactly) mean greater than,\n"
         "and \"equal\" allows one twentieth of the size either way (100 matches 95 to 104).",
         {{"name", "TERMS", false, "comma-separated name terms (substring unless * or ? is in the term)"},
          {"type", "WORD", false, "dir or file (regular files only)"},
          {"ext", "EXTS", false, "comma-separated extensions: files named *.EXT"},
          {"user", "USER", false, "the owner, a user name"},
          {"group", "GROUP", false, "the group, a group name"},
          {"mtime", "OP:SECONDS", false, "modification time: before:T, or at or after with any other word"},
          {"crtime", "OP:SECONDS", false, "creation time, as --mtime"},
          {"atime", "OP:SECONDS", false, "access time, as --mtime"},
          {"size", "OP:BYTES", false, "size: equal:N, less:N, or greater than with any other word"}},
         {{"FILE...", "real paths to test in memory"}},
         RunConditions},
        {"ls",
         "a directory's page of entries, or the shares at /, as the web interface gets it",
         "Lists PATH as the file manager's listing request does for USER: resolved first\n"
         "(NvoFullPathGet), refused unless USER may list its share (CheckShareListPrivilege; 407\n"
         "when the check gives no code), then read as USER (initgroups, setegid, seteuid: needs\n"
         "root) so modes and ACL masks are USER's (NvoEnum::NvoLibDirEntryListEnum). \"/\" lists the\n"
         "home folder and the shares USER may see (NvoEnum::NvoLibShareEntryListEnum).\n"
         "\n"
         "Sorting, order and paging are the library's: directories first, then the key (size,\n"
         "mtime, crtime, ctime, atime, user and group by id, posix, type; anything else sorts by\n"
         "name); --desc reverses the whole list; the total counts every entry before the page is\n"
         "cut, and --limit 0 (the default) gives every entry. A page past the end is empty.\n"
         "\n"
         "--json prints {\"total\",\"offset\",\"files\"} with each entry as DumpFileInfo renders it\n"
         "for the --info groups; the text is a table of the same groups, a folder's name ending in\n"
         "\"/\". Default info: every group but volume_status and sync_share; at \"/\" volume_status too.",
         {{"user", "USER", true, kUserHelp},
          {"sort", "KEY", false,
           "sort key: size, mtime, crtime, ctime, atime, user, group, posix, type, name"},
          {"desc", nullptr, false, "descending: the sorted list reversed"},
          {"offset", "N", false, "the page's first entry, from 0"},
          {"limit", "N", false, "at most N entries (0: all)"},
          {"info", "NAMES", false,
           "comma-separated: real_path,size,owner,time,perm,type,mount_point_type,volume_status,sync_share"},
          {"type", "WORD", false, "dir, file or all (default); not at /"},
          {"name", "TERMS", false, "name terms as norvo conditions --name takes them; not at /"}},
         {{"PATH", "a user-visible path (/share/dir, /home/...), or / for the shares"}},
         RunLs},
        {"walk",
         "every entry below a folder, as the directory walker hands it to its callback",
         "Resolves PATH for USER (NvoFullPathGet), refuses it unless USER may list its share\n"
         "(CheckShareListPrivilege), then walks it as USER (initgroups, setegid, seteuid: needs root)\n"
         "with NvoDirectoryWalker. Each callback prints one line: the type (d folder, f file, l link,\n"
         "? other), the size, the user path and the real path; --json prints one object per line\n"
         "with \"user_path\", \"real_path\", \"name\", \"type\" and \"size\" (and \"phase\" with\n"
         "--order both). Links are reported, never followed; hidden names are not reported.\n"
         "\n"
         "Orders: top-down (Walk_TopDown, the default); pre and post (Walk with only that callback);\n"
         "both (Walk with both, each line marked pre or post); first-folder (Walk_FirstFolder_First:\n"
         "the whole folder first, then each sub-folder top-down; --first-only stops after the\n"
         "folder). --ignore says which failures are passed over silently: permission (EACCES and\n"
         "EPERM, the default), all, or none; one that is not ends the walk (exit 1, logged).\n"
         "Ctrl-C sets the walker's cancel flag: the walk stops before the next entry (exit 1).",
         {{"user", "USER", true, kUserHelp},
          {"order", "ORDER", false, "top-down (default), pre, post, both or first-folder"},
          {"first-only", nullptr, false, "with --order first-folder: the folder alone"},
          {"ignore", "MODE", false, "permission (default), all or none"},
          {"skip-recycle", nullptr, false, "do not visit shares' recycle bins"}},
         {{"PATH", "a folder's user-visible path (/share/dir, /home/...)"}},
         RunWalk},
        {"subdirs",
         "the sub-folders of a real directory, as the folder tree gets them",
         "Lists the sub-folders of the real directory PATH as USER (initgroups, setegid, seteuid:\n"
         "needs root), as the folder tree does (NvoLibEnumSubDir): sorted by name without regard\n"
         "to case, hidden names, files and links to folders left out. A folder on a network mount\n"
         "whose server is gone is listed as \"unreachable\" (mount type \"remotefail\" in JSON).\n"
         "PATH is taken as it is: no share is looked up and no share privilege checked, only\n"
         "USER's own right to enter and read it; it must be absolute.",
         {{"user", "USER", true, kUserHelp}},
         {{"PATH", "an absolute real directory, e.g. /volume1/photo"}},
         RunSubdirs},
        {"tasks",
         "a user's background tasks: list, show, wait, kill, clean, start",
         "Works on USER's task records (the task store). ACTION is one of:\n"
         "  list             every task: finished or running, and its progress\n"
         "  show ID          the record: pid, creation time, finished, \"progress\" and \"data\"\n"
         "  wait ID KEY      WaitForMgrTaskDataReady with --limit (10 a pass of 100 ms)\n"
         "  kill ID          DoKill of the task's process; a finished task is never signalled\n"
         "  clean            CleanTimeOutTasks: finished \"Tovana_\" tasks two days old go\n"
         "  start ID         a demo worker that runs as USER and saves --steps steps of progress\n"
         "A task whose process has gone counts as finished.",
         {{"user", "USER", true, kUserHelp},
          {"limit", "N", false, "the wait limit (default 100, about a second)"},
          {"steps", "N", false, "the demo worker's steps, 200 ms each (default 5)"}},
         {{"ACTION", "list, show, wait, kill, clean or start"}, {"ARG...", "ID, or ID KEY for wait"}},
         RunTasks},
        {"search-db",
         "a search task's result database: create, insert, list, delete, remove",
         "Works as USER (initgroups, setegid, seteuid: needs root) on USER's search tasks on VOLUME\n"
         "(/volume1), each a database under VOLUME/@tmp/norvo/FBSearch/USER. ACTION is one of:\n"
         "  create           a new task (or the task --task ID) and its empty database\n"
         "  insert PATH...   stores the hits of real paths (/volume1/photo/2013/a.jpg; the share is\n"
         "                   the second component)\n"
         "  list             a page of hits: --offset, --limit (default 50), --sort KEY (name, size,\n"
         "                   mtime, crtime, ctime, atime, user, group, posix, type, ppath) with\n"
         "                   --desc, --type file|dir|all, --pattern P (names containing P)\n"
         "  delete PATH      the hit of PATH and every hit below it\n"
         "  remove           the task's database\n"
         "Every action but create needs --task ID. The sqlite3 shell reads the database.",
         {{"user", "USER", true, kUserHelp},
          {"volume", "VOLUME", true, "the volume of the task: /volume1, /volumeUSB1, ..."},
          {"task", "ID", false, "the task's id (create: an id of one's choosing)"},
          {"offset", "N", false, "list: the first hit of the page (default 0)"},
          {"limit", "N", false, "list: the page's size (default 50)"},
          {"sort", "KEY", false, "list: the sort key"},
          {"desc", nullptr, false, "list: with --sort, descending"},
          {"type", "WORD", false, "list: file, dir or all (default)"},
          {"pattern", "P", false, "list: names containing P (* and ? are wildcards)"}},
         {{"ACTION", "create, insert, list, delete or remove"},
          {"PATH...", "real paths for insert and delete"}},
         RunSearchDb},
        {"search",
         "search folders as a user, by walking or through the volume index",
         "Searches the user-visible FOLDERs as USER (initgroups, setegid, seteuid: needs root) for\n"
         "entries that meet every condition given: --name (comma-separated terms, each a substring\n"
         "unless it holds * or ?; a term in double quotes must match on its own), --ext, --type,\n"
         "--owner, --group, --mtime, --atime (before:T or after:T, T in seconds since the epoch)\n"
         "and --size (equal:B, less:B or greater:B; equal allows a twentieth either way). A volume\n"
         "with a ready index is searched through it, the others by walking; either way USER finds\n"
         "only what USER may list, never hidden names nor recycle bins. The search is a task of\n"
         "the task store (\"Tovana_\" and its id; \"progress\", and \"data\" with the volume and\n"
         "the hits); its hits are kept in a result database that search-results pages. Ctrl-C\n"
         "stops it and keeps the hits found so far. Prints the task id and the number of hits.",
         {{"user", "USER", true, kUserHelp},
          {"sid", "SID", false, "the login sid (default: norvo; domain and directory accounts need theirs)"},
          {"name", "TERMS", true, "name terms, comma-separated"},
          {"ext", "EXTS", false, "extensions, comma-separated (files only)"},
          {"type", "WORD", false, "file or dir"},
          {"owner", "USER", false, "the owner's name"},
          {"group", "GROUP", false, "the group's name"},
          {"mtime", "OP:T", false, "modified before:T or after:T"},
          {"atime", "OP:T", false, "accessed before:T or after:T"},
          {"size", "OP:B", false, "equal:B, less:B or greater:B bytes"},
          {"current-dir-only", nullptr, false, "the folders' own entries, nothing deeper"}},
         {{"FOLDER...", "user-visible folders: /share/dir, /home/..."}},
         RunSearch},
        {"search-results",
         "a page of a search's hits",
         "Pages the hits of USER's search TASK (the id search printed), as USER: --offset,\n"
         "--limit (default 50), --sort KEY (name, size, mtime, crtime, ctime, atime, user, group,\n"
         "posix, type, ppath) with --desc. A search still running shows the hits so far.",
         {{"user", "USER", true, kUserHelp},
          {"task", "ID", true, "the search's task id"},
          {"offset", "N", false, "the first hit of the page (default 0)"},
          {"limit", "N", false, "the page's size (default 50)"},
          {"sort", "KEY", false, "the sort key"},
          {"desc", nullptr, false, "with --sort, descending"}},
         {},
         RunSearchResults},
        {"index",
         "a volume's file index: build, update, status, watch (root)",
         "Works on the file index of VOLUME (/volume1), which searches use instead of walking\n"
         "when it is ready. ACTION is one of:\n"
         "  build    walks the whole volume into a new index that replaces the old one when done\n"
         "  update   reads again only the folders whose times moved, and new ones\n"
         "  status   ready, damaged or none; entries, folders, size, when built and updated\n"
         "  watch    an update, then every change as it happens (inotify), until Ctrl-C or\n"
         "           SIGTERM; a file created is found within a second\n"
         "Without watch, the index is as fresh as its last build or update.",
         {},
         {{"ACTION", "build, update, status or watch"}, {"VOLUME", "the volume: /volume1, ..."}},
         RunIndex},
        {"upload",
         "an upload's last steps: check the target, move the file in, log it",
         "Does what the upload program does once the file has arrived: CheckFile for DEST (a\n"
         "user-visible path) as USER, which takes USER's identity (groups, gid, uid; needs root),\n"
         "then MoveFile of SRC to DEST's real path, owned by USER (SRC is moved: renamed on the\n"
         "same volume, else copied and removed), then one transfer record (NvoLibDoLog, when\n"
         "filebrowserxferlog is on; the client is REMOTE_ADDR, else 127.0.0.1). An existing\n"
         "file is replaced unless --no-overwrite. Ctrl-C cancels the move; DEST is left as it was.",
         {{"user", "USER", true, kUserHelp},
          {"sid", "SID", false, "the login sid of the account"},
          {"no-overwrite", nullptr, false, "refuse a DEST that exists (upload type 0)"}},
         {{"SRC", "the uploaded file (a real path); USER must be able to read and remove it"},
          {"DEST", "a user-visible target path: /share/dir/file, /home/..."}},
         RunUpload},
        {"xferlog",
         "write one transfer record; show the device's address",
         "Records ACTION on PATH by USER in the transfer log (NvoLibDoLog: only when the setting\n"
         "filebrowserxferlog is yes; --force writes regardless, NvoLibDoFileBrowserLog). ACTION\n"
         "is one of download, upload, delete, rename, copy, move, \"property set\", mkdir,\n"
         "\"download test\". The client is REMOTE_ADDR, else 127.0.0.1. Also prints the device's\n"
         "address as a client sees it (GetRemoteAddr: HTTPS, HTTP_HOST and the settings).",
         {{"user", "USER", true, kUserHelp},
          {"size", "BYTES", false, "the size to record (default 0)"},
          {"dir", nullptr, false, "PATH is a folder"},
          {"force", nullptr, false, "write even when the transfer log is off"}},
         {{"ACTION", "the logged word"}, {"PATH", "the user-visible path to record"}},
         RunXferlog},
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
