// Listing a directory of 100,000 files and 2,000 folders (several owners, one entry in ten with a
// POSIX ACL, a tmpfs volume with ACLs), as user alice, one page of 100 entries sorted by name.
//
// References, measured in the same run:
//  - the floor: a plain function that makes only the system calls the answer can't do without
//    (read the directory, one lstat per entry, owner and group names looked up once per id,
//    sort by case-insensitive name; with the permission flag also the one extended-attribute
//    probe per entry that tells whether it carries an ACL);
//  - GNU ls -l of the same directory, output to /dev/null (fork and exec per iteration).
// Counters: "x_floor" (time over the floor with the same flags), "x_ls" (time over ls -l), the
// same as "cpu_x_floor" and "cpu_x_ls" in CPU time (user and system; steadier on a loaded
// machine), and
// for the listing "bytes_per_entry" (peak resident growth of one listing in a fresh child,
// divided by the entries).
// Goals: every info flag: x_floor <= 1.3 and x_ls < 1; without the permission flag:
// x_floor <= 1.2.
#include <dirent.h>
#include <fcntl.h>
#include <grp.h>
#include <malloc.h>
#include <pwd.h>
#include <stdio.h>
#include <string.h>
#include <strings.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <list>
#include <map>
#include <random>
#include <string>
#include <unordered_map>
#include <vector>

#include <benchmark/benchmark.h>

#include "appliance.h"
#include "norvo/norvoenum.h"

namespace {

constexpr int kFiles = 100000;
constexpr int kFolders = 2000;
constexpr int kEntries = kFiles + kFolders;
constexpr const char *kRealPath = "/volume1/public/big";
constexpr const char *kUserPath = "/public/big";
constexpr int kAllFlags = 0x7f;
constexpr int kNoPermFlags = 0x6f;

uid_t g_uid = 0;  // alice
gid_t g_gid = 0;
std::vector<gid_t> g_groups;
std::map<int, double> g_floorSeconds, g_floorCpu;  // by info flags
double g_lsSeconds = 0, g_lsCpu = 0;

// Realistic names: camera files, documents, music, mixed case, blanks and punctuation.
std::string MakeName(std::mt19937 &random, int i, bool folder) {
    static const char *words[] = {"Report", "budget",        "Holiday", "scan",   "Invoice",
                                  "draft",  "Meeting notes", "family",  "Backup", "project",
                                  "résumé", "Track",         "IMG",     "DSC",    "Final (2)"};
    static const char *extensions[] = {".jpg", ".JPG", ".pdf",  ".docx", ".mp3",
                                       ".txt", ".mkv", ".xlsx", ".png",  ""};
    char buffer[128];
    const char *word = words[random() % (sizeof words / sizeof *words)];
    if (folder) {
        snprintf(buffer, sizeof buffer, "%s %04d", word, i);
    } else if (i % 3 == 0) {
        snprintf(buffer, sizeof buffer, "IMG_2019%02u%02u_%06d%s", 1 + static_cast<unsigned>(random() % 12),
                 1 + static_cast<unsigned>(random() % 28), i, extensions[random() % 2]);
    } else {
        snprintf(buffer, sizeof buffer, "%s %s-%06d%s", word,
                 words[random() % (sizeof words / sizeof *words)], i,
                 extensions[random() % (sizeof extensions / sizeof *extensions)]);
    }
    return buffer;
}

// The POSIX ACL attribute: owner rw, bob rw, owning group r, mask rw, other r.
std::vector<char> AclValue(uid_t bob) {
    struct Entry {
        uint16_t tag, perm;
        uint32_t id;
    };
    const Entry entries[] = {{0x01, 6, 0xFFFFFFFF},
                             {0x02, 6, bob},
                             {0x04, 4, 0xFFFFFFFF},
                             {0x10, 6, 0xFFFFFFFF},
                             {0x20, 4, 0xFFFFFFFF}};
    std::vector<char> value(4 + sizeof entries);
    const uint32_t version = 2;
    memcpy(value.data(), &version, 4);
    memcpy(value.data() + 4, entries, sizeof entries);
    return value;
}

void BuildDirectory(norvo::testing::Appliance &appliance) {
    appliance.MakeDir(kRealPath, "root", 0777);
    const char *owners[] = {"root", "alice", "bob", "admin", "carol", "dave", "erin", "frank"};
    std::vector<std::pair<uid_t, gid_t>> ids;
    for (const char *owner : owners) {
        ids.emplace_back(appliance.Uid(owner), owner == std::string("root") ? 0 : appliance.Gid("users"));
    }
    ids[2].second = appliance.Gid("staff");
    const std::vector<char> acl = AclValue(appliance.Uid("bob"));
    std::mt19937 random(7);
    const int dir = open(kRealPath, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    for (int i = 0; i < kEntries; ++i) {
        const bool folder = i < kFolders;
        const std::string name = MakeName(random, i, folder);
        const auto &[uid, gid] = ids[random() % ids.size()];
        int fd;
        if (folder) {
            if (mkdirat(dir, name.c_str(), 0755) != 0)
                abort();
            fd = openat(dir, name.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
        } else {
            fd = openat(dir, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0644);
        }
        if (fd < 0 || fchown(fd, uid, gid) != 0 ||
            fchmod(fd, folder ? 0755 : (i % 7 == 0 ? 0600 : 0644)) != 0)
            abort();
        if (i % 10 == 0 && fsetxattr(fd, "system.posix_acl_access", acl.data(), acl.size(), 0) != 0)
            abort();
        close(fd);
    }
    close(dir);
}

// Runs fn as alice (effective ids only: root comes back afterwards).
template <typename Fn>
auto AsAlice(Fn fn) {
    if (setgroups(g_groups.size(), g_groups.data()) != 0 || setegid(g_gid) != 0 || seteuid(g_uid) != 0)
        abort();
    auto result = fn();
    if (seteuid(0) != 0 || setegid(0) != 0 || setgroups(0, nullptr) != 0)
        abort();
    return result;
}

struct FloorEntry {
    std::string name;
    struct stat info;
    const std::string *user;
    const std::string *group;
    bool acl;
};

// The floor: the unavoidable system calls for the same answer, and the sort.
size_t Floor(bool perm) {
    std::unordered_map<uid_t, std::string> users;
    std::unordered_map<gid_t, std::string> groups;
    std::vector<FloorEntry> entries;
    DIR *dir = opendir(kRealPath);
    if (dir == nullptr)
        abort();
    const int fd = dirfd(dir);
    std::string path = std::string(kRealPath) + "/";
    const size_t base = path.size();
    while (const dirent *entry = readdir(dir)) {
        if (entry->d_name[0] == '.' &&
            (entry->d_name[1] == '\0' || (entry->d_name[1] == '.' && entry->d_name[2] == '\0')))
            continue;
        FloorEntry e;
        e.name = entry->d_name;
        if (fstatat(fd, entry->d_name, &e.info, AT_SYMLINK_NOFOLLOW) != 0)
            continue;
        auto user = users.find(e.info.st_uid);
        if (user == users.end()) {
            const passwd *record = getpwuid(e.info.st_uid);
            user = users.emplace(e.info.st_uid, record ? record->pw_name : "").first;
        }
        auto group = groups.find(e.info.st_gid);
        if (group == groups.end()) {
            const struct group *record = getgrgid(e.info.st_gid);
            group = groups.emplace(e.info.st_gid, record ? record->gr_name : "").first;
        }
        e.user = &user->second;
        e.group = &group->second;
        e.acl = false;
        if (perm) {
            path.resize(base);
            path += entry->d_name;
            e.acl = lgetxattr(path.c_str(), "system.posix_acl_access", nullptr, 0) > 0;
        }
        entries.push_back(std::move(e));
    }
    closedir(dir);
    std::sort(entries.begin(), entries.end(), [](const FloorEntry &a, const FloorEntry &b) {
        const bool aDir = S_ISDIR(a.info.st_mode), bDir = S_ISDIR(b.info.st_mode);
        if (aDir != bDir)
            return aDir;
        return strcasecmp(a.name.c_str(), b.name.c_str()) < 0;
    });
    std::vector<FloorEntry> page(entries.begin(), entries.begin() + std::min<size_t>(100, entries.size()));
    benchmark::DoNotOptimize(page.data());
    return entries.size();
}

size_t Listing(int flags) {
    NvoEnum enumeration;
    std::list<DIRENTRY_INFO> out;
    unsigned long total = 0;
    if (enumeration.NvoLibDirEntryListEnum(kUserPath, kRealPath, "name", flags, 0, 100, true,
                                           DIR_ENTRY_TYPE_ALL, {}, out, &total) != 1 ||
        out.size() != 100) {
        return 0;
    }
    return total;
}

int RunLs() {
    const pid_t pid = fork();
    if (pid == 0) {
        const int null = open("/dev/null", O_WRONLY | O_CLOEXEC);
        if (null < 0 || dup2(null, 1) < 0 || setgroups(g_groups.size(), g_groups.data()) != 0 ||
            setgid(g_gid) != 0 || setuid(g_uid) != 0) {
            _exit(126);
        }
        execlp("ls", "ls", "-l", kRealPath, static_cast<char *>(nullptr));
        _exit(127);
    }
    int status = 0;
    if (pid < 0 || waitpid(pid, &status, 0) != pid)
        return -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

long PeakResidentKiB() {
    FILE *status = fopen("/proc/self/status", "re");
    if (status == nullptr)
        return -1;
    char line[256];
    long kib = -1;
    while (fgets(line, sizeof line, status) != nullptr) {
        if (sscanf(line, "VmHWM: %ld kB", &kib) == 1)
            break;
    }
    fclose(status);
    return kib;
}

// Peak resident growth, in bytes, of fn run once in a fresh child (whose peak is first reset to
// its current size: clear_refs 5).
template <typename Fn>
long PeakGrowth(Fn fn) {
    int fds[2];
    if (pipe(fds) != 0)
        return -1;
    const pid_t pid = fork();
    if (pid == 0) {
        malloc_trim(0);  // free heap left by earlier runs would hide the growth
        const int reset = open("/proc/self/clear_refs", O_WRONLY | O_CLOEXEC);
        const bool cleared = reset >= 0 && write(reset, "5", 1) == 1;
        if (reset >= 0)
            close(reset);
        const long before = PeakResidentKiB();
        fn();
        const long growth = cleared && before >= 0 ? (PeakResidentKiB() - before) * 1024 : -1;
        _exit(write(fds[1], &growth, sizeof growth) == sizeof growth ? 0 : 1);
    }
    close(fds[1]);
    long growth = -1;
    if (read(fds[0], &growth, sizeof growth) != sizeof growth)
        growth = -1;
    close(fds[0]);
    waitpid(pid, nullptr, 0);
    return growth;
}

double Seconds(const benchmark::State &state, double elapsed) {
    return elapsed / static_cast<double>(state.iterations());
}

double CpuNow() {
    rusage self{}, children{};
    getrusage(RUSAGE_SELF, &self);
    getrusage(RUSAGE_CHILDREN, &children);
    const auto seconds = [](const timeval &t) { return static_cast<double>(t.tv_sec) + t.tv_usec / 1e6; };
    return seconds(self.ru_utime) + seconds(self.ru_stime) + seconds(children.ru_utime) +
           seconds(children.ru_stime);
}

// Wall seconds per iteration; *cpu gets the CPU seconds per iteration (user and system, this
// process and its waited-for children).
template <typename Fn>
double TimeLoop(benchmark::State &state, Fn fn, double *cpu) {
    double elapsed = 0, used = 0;
    for (auto _ : state) {
        const double cpuStart = CpuNow();
        const auto start = std::chrono::steady_clock::now();
        fn();
        elapsed += std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
        used += CpuNow() - cpuStart;
    }
    *cpu = Seconds(state, used);
    return Seconds(state, elapsed);
}

void FloorBench(benchmark::State &state) {
    const int flags = static_cast<int>(state.range(0));
    size_t count = 0;
    double cpu = 0;
    const double seconds = AsAlice([&] {
        return TimeLoop(
            state, [&] { count = Floor((flags & 0x10) != 0); }, &cpu);
    });
    if (count != static_cast<size_t>(kEntries))
        state.SkipWithError("the floor missed entries");
    g_floorSeconds[flags] = seconds;
    g_floorCpu[flags] = cpu;
    state.counters["bytes_per_entry"] =
        static_cast<double>(PeakGrowth([&] { return AsAlice([&] { return Floor((flags & 0x10) != 0); }); })) /
        kEntries;
}

void LsBench(benchmark::State &state) {
    int status = 0;
    g_lsSeconds = TimeLoop(
        state, [&] { status = RunLs(); }, &g_lsCpu);
    if (status != 0)
        state.SkipWithError("ls -l failed");
    if (g_floorSeconds.count(kAllFlags)) {
        state.counters["x_floor"] = g_lsSeconds / g_floorSeconds[kAllFlags];
        state.counters["cpu_x_floor"] = g_lsCpu / g_floorCpu[kAllFlags];
    }
}

void ListingBench(benchmark::State &state) {
    const int flags = static_cast<int>(state.range(0));
    size_t total = 0;
    double cpu = 0;
    const double seconds = AsAlice([&] {
        return TimeLoop(
            state, [&] { total = Listing(flags); }, &cpu);
    });
    if (total != static_cast<size_t>(kEntries)) {
        state.SkipWithError("the listing failed or missed entries");
        return;
    }
    if (g_floorSeconds.count(flags)) {
        state.counters["x_floor"] = seconds / g_floorSeconds[flags];
        state.counters["cpu_x_floor"] = cpu / g_floorCpu[flags];
    }
    if (g_lsSeconds > 0) {
        state.counters["x_ls"] = seconds / g_lsSeconds;
        state.counters["cpu_x_ls"] = cpu / g_lsCpu;
    }
    state.counters["bytes_per_entry"] =
        static_cast<double>(PeakGrowth([&] { return AsAlice([&] { return Listing(flags); }); })) / kEntries;
}

}  // namespace

int main(int argc, char **argv) {
    benchmark::Initialize(&argc, argv);
    norvo::testing::Appliance appliance;
    appliance.Basic();
    for (const char *user : {"carol", "dave", "erin", "frank"})
        appliance.AddUser(user);
    g_uid = appliance.Uid("alice");
    g_gid = appliance.Gid("users");
    g_groups = {appliance.Gid("users"), appliance.Gid("staff")};
    BuildDirectory(appliance);
    for (const int flags : {kAllFlags, kNoPermFlags}) {
        benchmark::RegisterBenchmark("Floor", FloorBench)
            ->Arg(flags)
            ->Unit(benchmark::kMillisecond)
            ->Iterations(5);
    }
    benchmark::RegisterBenchmark("LsDashL", LsBench)->Unit(benchmark::kMillisecond)->Iterations(5);
    for (const int flags : {kAllFlags, kNoPermFlags}) {
        benchmark::RegisterBenchmark("NvoLibDirEntryListEnum", ListingBench)
            ->Arg(flags)
            ->Unit(benchmark::kMillisecond)
            ->Iterations(5);
    }
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
