// The fault loop: every exported operation that takes platform resources runs with its Nth
// platform or system call failing (tools/faults), for N = 1, 2, ... until it runs through
// untouched. After every run nothing it took is left (descriptors, platform records; memory is
// LeakSanitizer's in the sanitized build), a reported failure has a code in the error slot, and
// no file is left half-written; the untouched run must give the right answer.
#include <dirent.h>
#include <errno.h>
#include <limits.h>
#include <pwd.h>
#include <string.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/sysinfo.h>
#include <stdlib.h>
#include <syslog.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <memory>
#include <regex>
#include <set>
#include <sstream>

#include <gtest/gtest.h>

#include "appliance.h"
#include "faults.h"
#include "fileidx.h"
#include "norvo/norvo.h"
#include "norvo/norvosharing.h"
#include "obx_task.h"
#include "quib_autoblock.h"
#include "quib_cgi.h"
#include "quib_fs.h"
#include "quib_login.h"
#include "quib_paths.h"
#include "quib_share.h"
#include "quib_user.h"
#include "quib_webutils.h"
#include "vlibc_err.h"
#include "vlibc_file.h"
#include "vlibc_line_file.h"

// A sharing login sleeps a second for each id it tries; the loop makes hundreds.
extern "C" __attribute__((visibility("default"))) unsigned sleep(unsigned) {
    return 0;
}

namespace {

using norvo::testing::Appliance;
namespace fs = std::filesystem;

// What one run of an operation gave.
enum Outcome {
    kRight,   // succeeded with the expected answer
    kFailed,  // reported failure: the error slot must say why
    kOther,   // succeeded with another answer (acceptable only while a call was made to fail)
};

Outcome Expect(bool ok, bool right) {
    return !ok ? kFailed : right ? kRight : kOther;
}

// Where an operation says why it failed. ACLAccess (and so NvoCheckPath) leaves a platform
// failure it has no code for in the platform's slot only, intended; some answer 0 without a slot.
enum Slot { kLibrarySlot, kPlatformSlot, kEitherSlot, kNoSlot };

struct Op {
    Op(const char *n, std::function<Outcome()> r, Slot s = kLibrarySlot, std::function<void()> p = nullptr,
       std::function<std::string()> t = nullptr)
        : name(n), run(std::move(r)), slot(s), prepare(std::move(p)), torn(std::move(t)) {}
    const char *name;
    std::function<Outcome()> run;  // the call is made before its answer is looked at
    Slot slot;
    std::function<void()> prepare;      // before each run: the state the run starts from
    std::function<std::string()> torn;  // after each run: what is left half-written, or ""
};

void PrintTo(const Op &op, std::ostream *out) {
    *out << op.name;
}

// Open descriptors with what they name, without the one reading the list.
std::map<int, std::string> OpenDescriptors() {
    std::map<int, std::string> open;
    DIR *dir = opendir("/proc/self/fd");
    while (const dirent *entry = readdir(dir)) {
        const int fd = atoi(entry->d_name);
        char target[PATH_MAX] = "";
        if (entry->d_name[0] != '.' && fd != dirfd(dir) &&
            readlink(("/proc/self/fd/" + std::string(entry->d_name)).c_str(), target, sizeof target - 1) >= 0) {
            open[fd] = target;
        }
    }
    closedir(dir);
    return open;
}

std::string Read(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

void Write(const std::string &path, const std::string &text) {
    std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
}

// Temporaries a settings writer left beside file.
std::string Leftovers(const std::string &file) {
    const fs::path path(file);
    std::string left;
    for (const auto &entry : fs::directory_iterator(path.parent_path())) {
        if (entry.path().filename().string().rfind("." + path.filename().string() + ".", 0) == 0) {
            left += entry.path().string() + " ";
        }
    }
    return left;
}

// A settings file must be the old or the new version, whole, with no temporary beside it.
// The versions are the appliance's settings with or without a line of ours.
std::string g_settings;
std::function<std::string()> OldOrNew(std::string before, std::string after) {
    return [=] {
        const std::string text = Read(QUIB_INFO_CONF);
        return (text == g_settings + before || text == g_settings + after ? "" : "torn text: " + text) +
               Leftovers(QUIB_INFO_CONF);
    };
}

const std::string kDir = "/volume1/public/dir";
const std::string kUpload(100000, 'u');

// An upload is in place whole or not there at all, and no temporary is left beside it.
std::string WholeOrNone() {
    const std::string text = Read(kDir + "/up");
    return (text.empty() || text == kUpload ? "" : "torn upload of " + std::to_string(text.size())) + Leftovers(kDir + "/up");
}
char g_sid[64];
Appliance *g_app;
bool g_created;

int g_body = -1, g_null = -1;  // a request body and the response's sink, kept open

void Login(const char *user) {
    ASSERT_EQ(QUIBLoginCreate(user, "secret", "192.0.2.1", g_sid, sizeof g_sid), 0);
}

std::string Names(const std::list<DIRENTRY_INFO> &entries) {
    std::string names;
    for (const DIRENTRY_INFO &entry : entries) {
        names += entry.name + " ";
    }
    return names;
}

// Tovana_1: two days old, data "d" at 0.25, finished or not.
void TaskReady(bool finished) {
    OBX::TaskMgr mgr("alice");
    std::unique_ptr<OBX::Task> task(mgr.getTask("Tovana_1"));
    if (task == nullptr) {
        task.reset(mgr.createTask("Tovana_1", getpid()));
    }
    ASSERT_TRUE(task && task->setCreateTime(time(nullptr) - 200000) && SaveTaskData(task.get(), Json::Value("d"), 0.25f));
    if (finished) {
        ASSERT_TRUE(task->setFinished());
    }
}

// A result database of three hits, and what a query of it gives.
const char kIndexDb[] = "/volume1/public/hits.db";
void FreshIndexDb(bool withHits) {
    for (const char *suffix : {"", "-wal", "-shm"}) {
        unlink((std::string(kIndexDb) + suffix).c_str());
    }
    ASSERT_EQ(FILEIDXDBCreate(kIndexDb), 0);
    FI_FILE_INFO_DATA hits[3] = {};
    for (int i = 0; i < 3; ++i) {
        snprintf(hits[i].share, sizeof hits[i].share, "public");
        snprintf(hits[i].path, sizeof hits[i].path, "dir/%c.txt", 'a' + i);
        snprintf(hits[i].name, sizeof hits[i].name, "%c.txt", 'a' + i);
    }
    ASSERT_EQ(withHits ? FILEIDXDBInsert(kIndexDb, hits, 3) : 0, 0);
}
long long IndexedHits() {
    FI_QUERY all{};
    unsigned long long total = 0;
    return FILEIDXCountGet(kIndexDb, &all, &total) == 0 ? static_cast<long long>(total) : -1;
}

// A search task of alice's with a fixed id on /volume1, its database holding the three hits
// of FreshIndexDb when asked.
const char kTaskDir[] = "/volume1/@tmp/norvo/FBSearch/alice";
const char kTaskDb[] = "/volume1/@tmp/norvo/FBSearch/alice/5F5E10A3";
void FreshTask(bool withHits) {
    NvoSearchDBTask task("/volume1", "alice", "5F5E10A3");
    for (const char *suffix : {"", "-wal", "-shm"}) {
        unlink((std::string(kTaskDb) + suffix).c_str());
    }
    ASSERT_EQ(FILEIDXDBCreate(kTaskDb), 0);
    FreshIndexDb(true);
    FI_QUERY all{};
    const unsigned long long three = 3;
    const auto copy = [](FI_FILE_INFO_DATA *r, void *arg) {
        return FILEIDXDBInsert(static_cast<const char *>(arg), r, 1) == 0 ? 1 : 0;
    };
    ASSERT_EQ(withHits ? FILEIDXDBSelect(kIndexDb, &all, copy, const_cast<char *>(kTaskDb), &three, nullptr, 0) : 0, 0);
}
long long TaskHits() {
    FI_QUERY all{};
    unsigned long long total = 0;
    return FILEIDXCountGet(kTaskDb, &all, &total) == 0 ? static_cast<long long>(total) : -1;
}

const std::string kSessions = "/tmp/foldersharing.current.users";
const std::string kSharing = "/usr/quib/etc/quibsharing.conf";
std::string Shares(const char *user) {
    return std::to_string(g_app->Uid(user)) + "=\"true\"\n";
}

void OpenSink() {
    if (g_null < 0) {
        g_null = open("/dev/null", O_WRONLY);
    }
}

// A sharing-link request from 192.0.2.1 with the cookie L=ID; its header goes nowhere.
int SharingRequest(int (*call)(QUIB::WebCGI *)) {
    setenv("REQUEST_METHOD", "GET", 1), setenv("REMOTE_ADDR", "192.0.2.1", 1), setenv("HTTP_COOKIE", "L=ID", 1);
    unsetenv("CONTENT_LENGTH"), unsetenv("QUERY_STRING");
    QUIB::WebCGI cgi;
    return cgi.Init(-1, g_null) == 0 ? call(&cgi) : -9;
}

// A session that is alive ("ID", alice's) and one long expired ("OLD", bob's); after the
// authorisation only alice's, refreshed.
std::string SessionLines() {
    struct sysinfo info;
    sysinfo(&info);
    return "192.0.2.1,alice,ID,1," + std::to_string(info.uptime) + ",1,0,L\n192.0.2.1,bob,OLD,1,1,1,0,L\n";
}
std::string g_sessions;  // as the run found them
const char kRefreshed[] = "192\\.0\\.2\\.1,alice,ID,1,[0-9]+,2,0,L\n";

// A search of alice's for "a.txt" below public, initialised only or also run: whether it
// went through, and how many hits it stored.
bool SearchAlice(bool walk, unsigned long long *hits) {
    std::vector<FileSearch::FindComp *> conds;
    bool ok = FileSearch::FindFactory::createFindOp(FileSearch::FindFactory::FIND_FIELD_NAME, nullptr, "a.txt", conds);
    {
        FileSearch::NvoSearchWalker walker("alice", "sid", nullptr);
        ok = ok && walker.init({"/public"}, conds) && (!walk || walker.Walk({}));
        const FI_QUERY all{};
        *hits = 0;
        if (ok && FILEIDXCountGet(walker.getDBPath().c_str(), &all, hits) != 0) {
            *hits = ~0ULL;
        }
    }
    for (FileSearch::FindComp *cond : conds) {
        delete cond;
    }
    return ok;
}

const Op kOps[] = {
    {"DirListing",
     [] {
         NvoEnum enumeration;
         std::list<DIRENTRY_INFO> out;
         unsigned long total = 0;
         const int rc = enumeration.NvoLibDirEntryListEnum("/public/dir", kDir.c_str(), "name", 0xFF, 0, 0, true,
                                                           DIR_ENTRY_TYPE_ALL, {}, out, &total);
         return Expect(rc == 1, total == 2 && Names(out) == "sub a.txt ");
     }},
    {"ShareListing",
     [] {
         NvoEnum enumeration;
         std::list<DIRENTRY_INFO> out;
         unsigned long total = 0;
         const int rc = enumeration.NvoLibShareEntryListEnum("alice", nullptr, false, "name", 0x1FF, 0, 0, true, out,
                                                             &total);
         return Expect(rc == 1, Names(out) == "home photo public secret ");
     }},
    {"Privilege",
     [] {
         int priv = -1;
         unsigned flags = 99;
         const bool ok = NvoLibGetPrivilege("/photo/a", "bob", nullptr, &priv, &flags) == 0;
         return Expect(ok, priv == 1 && flags == 0);
     }},
    {"DomainPrivilege",  // asked through the platform with the login's sid
     [] {
         int priv = -1;
         unsigned flags = 99;
         const bool ok = NvoLibGetPrivilege("/public/a", "CORP\\dave", g_sid, &priv, &flags) == 0;
         return Expect(ok, priv == 2 && flags == 0);
     },
     kLibrarySlot, [] { g_sid[0] == '\0' ? Login("CORP\\dave") : void(); }},
    {"ValidShares",
     [] {
         PSZLIST list = NvoLibValidShareGen("alice", 1, 0);
         const bool right = VLIBCSzListCount(list) == 3;
         VLIBCSzListFree(list);
         return Expect(list != nullptr, right);
     }},
    {"ShareChecks",
     [] {
         int type = 1;
         const bool ok = CheckShareListPrivilege("bob", nullptr, "/photo/a") == 1 &&
                         CheckShareDownloadPrivilege("bob", nullptr, "/photo/a") == 1 &&
                         CheckShareUploadPrivilege("alice", nullptr, "/photo/a", &type) == 1;
         return Expect(ok, type == 1);
     },
     kNoSlot},
    {"EncryptedShare",
     [] {
         bool encrypted = false;
         const bool ok = NvoLibCheckEncryptShare("secret", &encrypted) == 1;
         return Expect(ok, encrypted);
     }},
    {"AclChecks",
     [] {
         const bool ok = ACLAccess((kDir + "/a.txt").c_str(), 0x1 | 0x2) == 0 && CheckDirListPrivilege(kDir.c_str()) == 1;
         const unsigned rootOnFile = ACL_PERM_ALL & ~(ACL_PERM_EXECUTE | ACL_PERM_DELETE_CHILD);
         return Expect(ok, GetACLPrivilege((kDir + "/a.txt").c_str()) == rootOnFile &&
                               NvoLibFileSystemSupported(kDir.c_str()) == 1);
     },
     kEitherSlot},
    {"FullPath",
     [] {
         std::string full, share, volume, sharePath;
         const bool ok = NvoFullPathGet("/photo/a", full, share, volume, sharePath, "alice") == 1;
         return Expect(ok, full == "/volume1/photo/a" && share == "photo" && sharePath == "/volume1/photo");
     }},
    {"HomePath",
     [] {
         std::string full, share, volume, sharePath;
         const bool ok = NvoFullPathGet("/home/a", full, share, volume, sharePath, "alice") == 1;
         return Expect(ok, full == "/volume1/homes/alice/a" && fs::is_directory("/volume1/homes/alice"));
     },
     kLibrarySlot, [] { fs::remove_all("/volume1/homes/alice"); },
     [] {
         // A home is never left behind with another owner or mode.
         struct stat st;
         if (stat("/volume1/homes/alice", &st) != 0 ||
             (st.st_uid == getpwnam("alice")->pw_uid && (st.st_mode & 07777) == 0755)) {
             return std::string();
         }
         return "home of uid " + std::to_string(st.st_uid) + ", mode " + std::to_string(st.st_mode & 07777);
     }},
    {"PathInfo",
     [] {
         PathInfo info;
         const bool ok = PathInfoFactory::create("alice", "/public/dir", info) == 1;
         return Expect(ok, info.fullPath == kDir);
     }},
    {"TransFullPath",
     [] {
         char out[256] = "";
         const bool ok = NvoLibTransFullPath("/photo/a", out, sizeof out) == 0;
         return Expect(ok, std::string(out) == "/volume1/photo/a");
     },
     kPlatformSlot},
    {"CheckPath",
     [] {
         std::string existing;
         const bool ok = NvoCheckPath((kDir + "/new/deeper").c_str(), true, 0x2, &existing) == 0;
         return Expect(ok, existing == kDir);
     },
     kEitherSlot},
    {"TmpDir",
     [] {
         const bool ok = NvoCreateTmpDir("/volume1") == 0;
         return Expect(ok, fs::is_directory("/volume1/@tmp/norvo"));
     },
     kNoSlot, [] { fs::remove_all("/volume1/@tmp"); }},
    {"SettingsSet",
     [] { return Expect(VLIBCFileSetKeyValue(QUIB_INFO_CONF, "fault", "new", 0) == 0, true); }, kPlatformSlot,
     [] { Write(QUIB_INFO_CONF, g_settings); }, OldOrNew("", "fault=\"new\"\n")},
    {"SettingsRemove", [] { return Expect(VLIBCFileRemoveKey(QUIB_INFO_CONF, "fault") == 0, true); }, kPlatformSlot,
     [] { Write(QUIB_INFO_CONF, g_settings + "fault=\"old\"\n"); }, OldOrNew("fault=\"old\"\n", "")},
    {"SettingsRead",
     [] {
         char value[8] = "";
         const bool ok = VLIBCFileGetKeyValue(QUIB_INFO_CONF, "userHomeEnable", value, sizeof value, 0) > 0 &&
                         VLIBCFileCheckKeyValue(QUIB_INFO_CONF, "userHomeEnable", "yes", 0) == 1 &&
                         VLIBUserPrivilegeHas("alice", "QUIB.Fault.Loop") == 1;
         return Expect(ok, std::string(value) == "yes");
     },
     kPlatformSlot},
    {"LoginCreate",
     [] {
         g_sid[0] = '\0';
         g_created = QUIBLoginCreate("alice", "secret", "192.0.2.1", g_sid, sizeof g_sid) == 0;
         return Expect(g_created, true);
     },
     kPlatformSlot, nullptr,
     [] {
         // A login that was made is whole; one that failed left nothing.
         char user[64] = "";
         const bool found = g_sid[0] != '\0' && QUIBLoginGet(g_sid, user, sizeof user) == 0;
         return found == g_created && (!found || std::string(user) == "alice") ? "" : "login: '" + std::string(user) + "'";
     }},
    {"LoginLookup",
     [] {
         char user[64] = "";
         const bool ok = QUIBLoginGet(g_sid, user, sizeof user) == 0 && QUIBLoginRemove(g_sid) == 0;
         return Expect(ok, std::string(user) == "alice");
     },
     kPlatformSlot, [] { Login("alice"); }},
    {"CgiRequest",
     [] {
         QUIB::WebCGI cgi;
         const bool ok = cgi.Init(g_body, g_null) == 0 && cgi.AddCookieToHeader("/", "s", "v") == 0 &&
                         cgi.WriteHeader() == 0;
         return Expect(ok, ok && std::string(cgi.In("b")) + cgi.GetCookie("id") == "2xyz");
     },
     kPlatformSlot,
     [] {
         setenv("REQUEST_METHOD", "POST", 1), setenv("CONTENT_TYPE", "application/x-www-form-urlencoded", 1);
         setenv("CONTENT_LENGTH", "7", 1), setenv("HTTP_COOKIE", "id=xyz", 1);
         if (g_body < 0) {
             g_body = memfd_create("body", 0), g_null = open("/dev/null", O_WRONLY);
             ASSERT_EQ(write(g_body, "a=1&b=2", 7), 7);
         }
         lseek(g_body, 0, SEEK_SET);
     }},
    {"CgiRecord",
     [] {
         setenv("HTTP_COOKIE", "id=xyz", 1);
         QuibCgi *cgi = QuibCgiAlloc("/tmp/r", "/tmp/r.lock");
         char id[8] = "";
         const bool ok = cgi != nullptr && QuibCgiGetInCookies(cgi, "id", id, sizeof id) == 0;
         QuibCgiFree(cgi);
         const int timeout = ok ? VLIBCConfGetOBXTimeout() : -1;
         return Expect(timeout > 0, std::string(id) == "xyz" && timeout == 30);
     },
     kPlatformSlot},
    {"SessionLines",  // a line goes in under the lock, whole or not at all, and is found again
     [] {
         const int lock = QuibCgiBeginCriticalSection("/tmp/fault.lock", 1000);
         bool ok = lock >= 0 && VLIBCFileAddLine("/tmp/fault.users", "b,2") == 0;
         ok = (lock < 0 || QuibCgiEndCriticalSection(lock) == 0) && ok;
         return Expect(ok && VLIBCFileGetLine("/tmp/fault.users", "b,", nullptr, 0) == 2, true);
     },
     kPlatformSlot, [] { Write("/tmp/fault.users", "a,1\n"); },
     [] {
         const std::string text = Read("/tmp/fault.users");
         const int lock = QuibCgiBeginCriticalSection("/tmp/fault.lock", 0);
         const bool free = lock >= 0 && QuibCgiEndCriticalSection(lock) == 0;
         return (text == "a,1\n" || text == "a,1\nb,2\n" ? "" : "torn text: " + text) + (free ? "" : " lock held");
     }},
    {"AutoBlock",
     [] {
         const bool ok = AutoBlockFailLoginSet("192.0.2.9", "FOLDER_SHARING") == 0;
         const int blocked = ok ? QuibCgiIsDeniedIP("192.0.2.9") : -1;
         const bool reset = blocked >= 0 && QUIBAutoBlockResetByIP("192.0.2.9") == 0;
         return Expect(reset && QuibCgiIsDeniedIP("::ffff:192.0.2.9") == 0, blocked == 1);
     },
     kPlatformSlot, [] { QUIBAutoBlockResetByIP("192.0.2.9"); }},
    {"Conditions",
     [] {
         std::vector<FileSearch::FindComp *> out;
         bool ok = true;
         for (auto [field, value] : {std::pair{FileSearch::FindFactory::FIND_FIELD_USER, "alice"},
                                     {FileSearch::FindFactory::FIND_FIELD_GROUP, "staff"},
                                     {FileSearch::FindFactory::FIND_FIELD_NAME, "a*,\"b\",c"}}) {
             ok = ok && FileSearch::FindFactory::createFindOp(field, nullptr, value, out);
         }
         const size_t made = out.size();
         for (FileSearch::FindComp *condition : out) {
             delete condition;
         }
         return Expect(ok, made == 3);
     }},
    {"Accounts",
     [] {
         NvoEnum enumeration;
         std::map<unsigned, _tag_USER_INFO_> users;
         std::map<unsigned, _tag_GROUP_INFO_> groups;
         std::list<unsigned> gids;
         const bool ok = enumeration.EnumAllUsers(users, AUTH_ALL) == 1 &&
                         enumeration.EnumAllGroups(groups, AUTH_ALL) == 1 &&
                         enumeration.EnumUserGroups(gids, "alice") == 1;
         const bool named = enumeration.UserEnum().GetUserNameByUID(0) == "root" &&
                            enumeration.UserEnum().GetGroupNameByGID(0) == "root";
         return Expect(ok, named && users.size() == 6 && groups.size() > 3 && gids.size() == 2);
     },
     kNoSlot},
    {"MountStatus",
     [] {
         NorvoMountStatus mounts;
         const bool ok = mounts.GetMountStatus() == 1;
         return Expect(ok, mounts.getFSTYPE("/volume1") == FSTYPE_TMPFS);
     },
     kPlatformSlot},
    {"MountType",
     [] {
         const std::string type = WebUtils::getMountType("/volume1");
         return Expect(!type.empty(), type == "tmpfs");
     },
     kPlatformSlot},
    {"RecycleBin",
     [] {
         const int bin = QUIBShareIsShareRecycle("/volume1/photo/#recycle");
         const int deeper = QUIBShareIsShareRecycle("/volume1/photo/a/#recycle");
         return Expect(bin >= 0 && deeper >= 0, bin == 1 && deeper == 0);
     },
     kPlatformSlot},
    {"IndexCreate",  // made whole, or not at all
     [] {
         const bool ok = FILEIDXDBCreate(kIndexDb) == 0;
         return Expect(ok, IndexedHits() == 0);
     },
     kPlatformSlot,
     [] { unlink(kIndexDb); },
     [] { return access(kIndexDb, F_OK) != 0 || IndexedHits() == 0 ? "" : "a damaged database"; }},
    {"IndexInsert",  // all three hits or none
     [] {
         FI_FILE_INFO_DATA hits[3] = {};
         for (int i = 0; i < 3; ++i) {
             snprintf(hits[i].path, sizeof hits[i].path, "%d", i);
         }
         const bool ok = FILEIDXDBInsert(kIndexDb, hits, 3) == 0;
         return Expect(ok, IndexedHits() == 3);
     },
     kPlatformSlot, [] { FreshIndexDb(false); },
     [] { return IndexedHits() == 0 || IndexedHits() == 3 ? "" : "torn: " + std::to_string(IndexedHits()); }},
    {"IndexOutput",
     [] {
         FI_OUTPUT_DB *out = nullptr;
         FI_FILE_INFO_DATA hit{};
         const bool ok = FILEIDXOutputDBOpen(kIndexDb, &out) == 0 && FILEIDXOutputDBInsert(out, &hit) == 0;
         const bool closed = FILEIDXOutputDBClose(out) == 0;
         return Expect(closed && ok, IndexedHits() == 1);
     },
     kPlatformSlot, [] { FreshIndexDb(false); }},
    {"VolumeIndexBuild",  // the index whole, or the old state and no scratch file left
     [] {
         const bool ok = FILEIDXIndexBuild("/volume1") == 0;
         return Expect(ok, FILEIDXIsIndexEnable("/volume1") == 1);
     },
     kPlatformSlot, [] { fs::remove_all("/volume1/@fileidx"); },
     [] {
         return std::string(fs::exists("/volume1/@fileidx/fileidx.db.new") ? "scratch left " : "") +
                (fs::exists("/volume1/@fileidx/fileidx.db") && FILEIDXIsIndexEnable("/volume1") != 1 ? "torn index" : "");
     }},
    {"VolumeIndexQuery",
     [] {
         __tag_FI_SQL_COND name{};
         FileSearch::setSqlCond(name, FI_COND_NAME, FI_OP_LIKE, std::string("*.IDXQ"), nullptr, nullptr);
         FI_TABLE_GEN_CONTEXT context{kIndexDb, nullptr, 0};
         const bool ok = FILEIDXResultGetAndTableGen("/volume1", &name, nullptr, nullptr, &context) == 0;
         return Expect(ok, IndexedHits() == 2);
     },
     kPlatformSlot,
     [] {
         if (!fs::exists("/volume1/@fileidx/fileidx.db")) {
             g_app->WriteFile(kDir + "/a.idxq").WriteFile(kDir + "/b.idxq");
             ASSERT_EQ(FILEIDXIndexBuild("/volume1"), 0);
         }
         FreshIndexDb(false);
     }},
    {"IndexSelect",
     [] {
         __tag_FI_SQL_COND below{};
         FileSearch::setSqlCond(below, FI_COND_PATH, FI_OP_PATH_LIKE, std::string("dir/*"), nullptr, nullptr);
         FI_QUERY query{&below, 1, {{FI_COND_NAME, 1}}};
         std::string names;
         const auto collect = [](FI_FILE_INFO_DATA *r, void *arg) { return *static_cast<std::string *>(arg) += r->name, 1; };
         const unsigned long long limit = 2;
         unsigned long long total = 0;
         const bool ok = FILEIDXCountGet(kIndexDb, &query, &total) == 0 &&
                         FILEIDXDBSelect(kIndexDb, &query, collect, &names, &limit, nullptr, 0) == 0;
         return Expect(ok, total == 3 && names == "c.txtb.txt");
     },
     kPlatformSlot, [] {
         if (IndexedHits() != 3) {
             FreshIndexDb(true);
         }
     }},
    {"Walk",  // the walker reports through its log only
     [] {
         struct Names : NvoDirectoryWalkerCallBack {
             std::set<std::string> seen;
             bool operator()(const std::string &, const std::string &, const std::string &, const std::string &name,
                             _tag_QUIBSTAT_ &, const std::string *) override {
                 seen.insert(name);
                 return true;
             }
         } pre, post;
         NvoDirectoryWalker walker(IGNORE_ERR_NONE, nullptr);
         const bool ok = walker.Walk("/public", "/public", "/volume1/public", &pre, &post, nullptr, true);
         const std::set<std::string> all{"dir", "a.txt", "sub"};
         return Expect(ok, pre.seen == all && post.seen == all);
     },
     kNoSlot},
    {"SubDirs",  // among the folders a live mount and a dead one
     [] {
         std::vector<_tag_SUBDIR_ENTRY_INFO_> out(1);
         out[0].name = "B";
         const int rc = NvoLibEnumSubDir("/volume1/photo", out);
         std::string names;
         for (const auto &folder : out) names += folder.name + ":" + folder.mountType + " ";
         return Expect(rc == 1, names == "B: nas2:remotefail vol:tmpfs ");
     },
     kLibrarySlot,
     [] {
         if (!fs::exists("/volume1/photo/vol")) g_app->AddVolume("/volume1/photo/vol").MountDeadRemote("/volume1/photo/nas2");
     }},
    {"TaskMgrOpen",  // root makes the owner's directory and database on first use
     [] {
         OBX::TaskMgr mgr("alice");
         return Expect(mgr.isOpen(), !mgr.hasTask("Tovana_1"));
     },
     kPlatformSlot, [] { fs::remove_all(QUIB_TASK_DIR); },
     [] {
         // Made whole or not at all: never a directory left as root's.
         struct stat st;
         return stat(QUIB_TASK_DIR "/alice", &st) != 0 || st.st_uid == getpwnam("alice")->pw_uid
                    ? std::string()
                    : "directory of uid " + std::to_string(st.st_uid);
     }},
    {"TaskGet",
     [] {
         OBX::TaskMgr mgr("alice");
         const std::unique_ptr<OBX::Task> task(mgr.getTask("Tovana_1"));
         return Expect(task != nullptr, task && task->getProperty("data") == "d" && task->isFinished());
     },
     kPlatformSlot, [] { TaskReady(true); }},
    {"SaveTaskData",
     [] {
         OBX::TaskMgr mgr("alice");
         const std::unique_ptr<OBX::Task> task(mgr.getTask("Tovana_1"));
         const bool ok = SaveTaskData(task.get(), Json::Value("new"), 0.5f);
         const std::unique_ptr<OBX::Task> saved(OBX::TaskMgr("alice").getTask("Tovana_1"));
         return Expect(ok, saved && saved->getProperty("data") == "new");
     },
     kPlatformSlot, [] { TaskReady(false); },
     [] {
         // Both properties or neither.
         const std::unique_ptr<OBX::Task> task(OBX::TaskMgr("alice").getTask("Tovana_1"));
         const std::string data = task ? task->getProperty("data").asString() : "";
         const double progress = task ? task->getProperty("progress").asDouble() : 0;
         return (data == "d" && progress == 0.25) || (data == "new" && progress == 0.5) ? "" : "torn: " + data;
     }},
    {"SharingLogin",
     [] {
         static char session[64];
         session[0] = '\0';
         const int rc = SharingRequest([](QUIB::WebCGI *cgi) {
             LOGIN_PARAMS params = {"alice", "Anomyous", "folderSharing", 15, 0};
             return NorvoLogin::FolderSharingLoginManager().login(cgi, session, sizeof session, &params, "L");
         });
         return Expect(rc == 1, Read(kSessions).find(",alice," + std::string(session) + ",") == 9);
     },
     kNoSlot, [] { unlink(kSessions.c_str()), OpenSink(), QUIBAutoBlockResetByIP("192.0.2.1"); },
     [] {
         // One whole line or none.
         const std::string text = Read(kSessions);
         return text.empty() || (text.rfind("192.0.2.1,alice,", 0) == 0 && text.find('\n') == text.size() - 1)
                    ? ""
                    : "torn: " + text;
     }},
    {"SharingAuthorize",
     [] {
         const int rc = SharingRequest([](QUIB::WebCGI *cgi) {
             char user[64];
             CONFIRM_POLICY policy = {15, 0};
             return NorvoLogin::IsAuthorizedByPath(cgi, "ID", user, sizeof user, &policy, CGI_POSITION_FILE_BROWSER,
                                                   "L");
         });
         return Expect(rc == 1, std::regex_match(Read(kSessions), std::regex(kRefreshed)));
     },
     kNoSlot, [] { Write(kSessions, g_sessions = SessionLines()), OpenSink(), QUIBAutoBlockResetByIP("192.0.2.1"); },
     [] {
         const std::string text = Read(kSessions);
         // Old, or swept: alice's line refreshed, as it was (her lookup failed) or gone (her
         // privilege check failed, which reads as not held).
         return text == g_sessions || text.empty() || std::regex_match(text, std::regex(g_sessions.substr(0, g_sessions.find('\n') + 1))) ||
                        std::regex_match(text, std::regex(kRefreshed))
                    ? ""
                    : "torn: " + text;
     }},
    {"MoveAcross",
     [] {
         const bool ok = MoveFile("alice", "/volume2/up", (kDir + "/up").c_str(), nullptr) == 1;
         return Expect(ok, Read(kDir + "/up") == kUpload);
     },
     kEitherSlot, [] { Write("/volume2/up", kUpload); fs::remove(kDir + "/up"); }, WholeOrNone},
    {"MoveSameVolume",
     [] {
         const bool ok = MoveFile("alice", "/volume1/up", (kDir + "/up").c_str(), nullptr) == 1;
         return Expect(ok, Read(kDir + "/up") == kUpload);
     },
     kEitherSlot, [] { Write("/volume1/up", kUpload); fs::remove(kDir + "/up"); }, WholeOrNone},
    {"Identity",
     [] {
         const bool ok = NvoLibUGIDSet(nullptr, "admin") == 0;
         return Expect(ok, geteuid() == 0 && getegid() == getpwnam("admin")->pw_gid);
     },
     kLibrarySlot, [] { (void)setegid(0); }},
    {"Chown2Admin",
     [] {
         const bool ok = NvoLibChown2Admin((kDir + "/a.txt").c_str(), "bob") == 0;
         struct stat st;
         return Expect(ok, stat((kDir + "/a.txt").c_str(), &st) == 0 && st.st_uid == g_app->Uid("bob"));
     },
     kNoSlot, [] { (void)chown((kDir + "/a.txt").c_str(), 0, 0); }},
    {"TransferLog", [] { return Expect(NvoLibDoLog("alice", "/public/a", 1, NORVO_ACTION_UPLOAD, false) == 1, true); },
     kPlatformSlot, [] { setenv("REMOTE_ADDR", "192.0.2.1", 1); }},
    {"RemoteAddr",
     [] {
         std::string out;
         return Expect(GetRemoteAddr(out) == "http://nas.example.net:5000", true);
     },
     kNoSlot, [] { setenv("HTTP_HOST", "nas:5000", 1); }},
    {"CleanTimeOutTasks",
     [] {
         CleanTimeOutTasks("alice");
         return Expect(true, !OBX::TaskMgr("alice").hasTask("Tovana_1"));
     },
     kNoSlot, [] { TaskReady(true); }},
    {"SearchTaskCreate",  // the folders and an empty database, or no folder of the wrong owner
     [] {
         std::unique_ptr<NvoSearchDBTask> task(NvoSearchDBTaskMgr("alice").createDBTask("/volume1", nullptr));
         const bool ok = task && FILEIDXDBCreate(task->getDBTaskFilePath().c_str()) == 0;
         struct stat st {};
         return Expect(ok, stat(kTaskDir, &st) == 0 && (st.st_mode & 07777) == 0700 && st.st_uid == g_app->Uid("alice"));
     },
     kEitherSlot, [] { fs::remove_all("/volume1/@tmp"); },
     [] {
         struct stat st {};
         return stat(kTaskDir, &st) != 0 || ((st.st_mode & 07777) == 0700 && st.st_uid == g_app->Uid("alice"))
                    ? "" : "a task folder of the wrong mode or owner";
     }},
    {"SearchTaskInsert",
     [] {
         NvoSearchDBTask task("/volume1", "alice", "5F5E10A3");
         _tag_QUIBSTAT_ st{};
         st.st_mode = 0100644;
         const bool ok = task.insertFile("public", kDir + "/a.txt", "public", kDir + "/a.txt", st);
         return Expect(ok, TaskHits() == 1);
     },
     kEitherSlot, [] { FreshTask(false); },
     [] { return TaskHits() == 0 || TaskHits() == 1 ? "" : "torn: " + std::to_string(TaskHits()); }},
    {"SearchTaskQuery",
     [] {
         const NvoSearchDBTask task("/volume1", "alice", "5F5E10A3");
         const bool desc = true;
         const auto all = static_cast<_tag_dir_entry_type_>(2);
         std::string names;
         const auto collect = [](FI_FILE_INFO_DATA *r, void *arg) { return *static_cast<std::string *>(arg) += r->name, 1; };
         unsigned long long total = 0;
         const bool ok = task.queryResult(1, 1, "name", &desc, &all, "TXT", collect, &names, &total);
         return Expect(ok, total == 3 && names == "b.txt");
     },
     kEitherSlot, [] {
         if (TaskHits() != 3) {
             FreshTask(true);
         }
     }},
    {"SharingSetPrivileges",
     [] {
         const bool ok = NorvoSharing::SharingManager().setPrivileges({{"alice", "true"}, {"bob", "no"}});
         return Expect(ok, Read(kSharing) == Shares("alice"));
     },
     kNoSlot, [] { Write(kSharing, Shares("bob")); },
     [] {
         // Each key is written whole: alice's added (or not), then bob's removed (or not).
         const std::string text = Read(kSharing);
         const bool whole = text == Shares("bob") || text == Shares("bob") + Shares("alice") ||
                            text == Shares("alice") || text.empty();
         return (whole ? "" : "torn text: " + text) + Leftovers(kSharing);
     }},
    {"SharingGetPrivileges",
     [] {
         const auto flags = NorvoSharing::SharingManager().getPrivileges();
         return Expect(!flags.empty(), flags == std::map<unsigned, bool>{{7, true}, {9, false}});
     },
     kNoSlot, [] { Write(kSharing, "7=\"true\"\n9=\"no\"\n"); }},
    {"SharingFolderPath",
     [] {
         setenv("HTTP_FOLDER_SHARING", "L", 1);
         QUIB::WebCGI cgi;
         const std::string folder = NorvoLogin::FolderSharingLoginManager().GetSharingFolderPath(cgi);
         unsetenv("HTTP_FOLDER_SHARING");
         return Expect(!folder.empty(), folder == "/public");
     },
     kNoSlot, [] { g_app->AddSharingLink({.id = "L", .owner = "bob", .path = "/public"}); }},
    {"SharingLandingPage",
     [] {
         fflush(stdout);
         const int saved = dup(1);
         dup2(g_null, 1);
         {
             QUIB::WebCGI cgi;
             NorvoLogin::FolderSharingLoginManager().WriteWebPage(cgi, "00", "/public");
         }
         fflush(stdout);
         dup2(saved, 1);
         close(saved);
         return Expect(true, true);
     },
     kNoSlot, [] { OpenSink(), g_app->WriteFile("/usr/quib/quibman/webman/texts/en/filemanager/filetable", "a=\"b\"\n"); }},
    {"SearchInit",  // a task and its empty database, the folders mapped
     [] {
         unsigned long long hits = 0;
         const bool ok = SearchAlice(false, &hits);
         return Expect(ok, hits == 0);
     },
     kEitherSlot},
    {"SearchWalk",
     [] {
         unsigned long long hits = 0;
         const bool ok = SearchAlice(true, &hits);
         return Expect(ok, hits == 1);
     },
     kEitherSlot},
    {"SearchWalkDB",  // through the volume's index
     [] {
         unsigned long long hits = 0;
         const bool ok = SearchAlice(true, &hits);
         return Expect(ok, hits == 1);
     },
     kEitherSlot, [] {
         if (FILEIDXIsIndexEnable("/volume1") != 1) {
             ASSERT_EQ(FILEIDXIndexBuild("/volume1"), 0);
         }
     }},
};

// Runs op with call n failing with err for n = 1, 2, ... until a run gets through.
void FaultLoop(const Op &op, int err) {
    constexpr long kMaxCalls = 5000;
    for (long n = 1; n <= kMaxCalls; ++n) {
        if (op.prepare) {
            op.prepare();
        }
        NvoLibSetErr(0);
        VLIBCErrSetEx(0, nullptr, 0);
        const auto fds = OpenDescriptors();
        const auto records = norvo::faults::LiveRecords();
        norvo::faults::Arm(n, err);
        const Outcome outcome = op.run();
        norvo::faults::Disarm();
        const std::string failed = norvo::faults::Fired();
        const int slot = op.slot == kPlatformSlot ? VLIBCErrGet()
                         : op.slot == kEitherSlot ? NvoLibGetErr() | VLIBCErrGet()
                                                  : NvoLibGetErr();
        const std::string where =
            "failing call " + std::to_string(n) + " (" + failed + ") with " + strerrorname_np(err);
        ASSERT_EQ(OpenDescriptors(), fds) << where;
        ASSERT_EQ(norvo::faults::LiveRecords(), records) << where;
        if (op.torn) {
            ASSERT_EQ(op.torn(), "") << where;
        }
        if (failed.empty()) {
            ASSERT_EQ(outcome, kRight) << "the run without a failure (" << n - 1 << " calls)";
            return;
        }
        if (outcome == kFailed && op.slot != kNoSlot) {
            ASSERT_NE(slot, 0) << where << " left the error slot empty";
        }
    }
    FAIL() << "still failing calls after " << kMaxCalls;
}

class Faults : public ::testing::TestWithParam<Op> {
protected:
    Appliance app_;
};

// ENOMEM stands for every failure; EACCES takes the branches where a refusal is an answer. (With
// EIO a listing deliberately ends without a library code.)
TEST_P(Faults, ReleaseEverythingAndSayWhy) {
    g_app = &app_;
    app_.Basic().WriteFile(kDir + "/a.txt", "hello", "alice").MakeDir(kDir + "/sub");
    app_.MakeDir("/volume1/homes/alice", "alice").SetDomain("CORP").AddUser("CORP\\dave");
    app_.SetAppPrivilege("QUIB.Fault.Loop", "@staff").SetAppPrivilege("QUIB.TVQ.App.Tovana3.Instance", "alice").SetSetting("auto_block_attempts", "1");
    app_.SetSetting("obx_timeout_minutes", "30");
    app_.SetAppPrivilege("QUIB.Fault.Loop", "@staff").SetSetting("auto_block_attempts", "1");
    app_.SetSetting("obx_timeout_minutes", "30").SetSetting("filebrowserxferlog", "yes");
    app_.SetSetting("ddns_update", "yes").SetSetting("ddns_select", "home").SetDefaultSetting("supportddns", "yes");
    app_.WriteFile("/usr/quib/etc/ddns.conf", "home.hostname=nas.example.net\n");
    g_settings = Read(QUIB_INFO_CONF);
    g_sid[0] = '\0';
    openlog(nullptr, LOG_NDELAY, LOG_USER);  // the log connection is the process's, not a run's
    for (const int err : {ENOMEM, EACCES}) {
        FaultLoop(GetParam(), err);
        if (HasFatalFailure()) {
            return;
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Ops, Faults, ::testing::ValuesIn(kOps),
                         [](const ::testing::TestParamInfo<Op> &param) { return std::string(param.param.name); });

}  // namespace
