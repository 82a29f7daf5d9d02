// Name caches: the owner and group names of 100,000 entries owned by 50 distinct users, as a
// listing asks for them, cost at most 50 NSS lookups per cache. Reference: the same names asked
// of the platform for every entry, without a cache.
//
// How lookups are counted: this executable defines getpwuid_r and getgrgid_r itself. The
// platform library calls them by symbol, and a definition in the executable comes first in the
// dynamic linker's search order, so every call from libnorvoplatform lands here, is counted and
// goes on to glibc's own function (dlsym RTLD_NEXT). Production code is unchanged; the count is
// what NSS was really asked.
#include <dlfcn.h>
#include <grp.h>
#include <pwd.h>

#include <atomic>
#include <random>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include "appliance.h"
#include "norvo/norvoenum.h"
#include "quib_user.h"

namespace {

std::atomic<long> g_userLookups{0};
std::atomic<long> g_groupLookups{0};

constexpr int kEntries = 100000;
constexpr int kOwners = 50;
// The uncached reference asks NSS (a file read each time) per entry: a sample is enough.
constexpr int kReferenceEntries = 2000;

struct Entry {
    unsigned int uid;
    unsigned int gid;
};

// Entries spread over 50 owners at random (fixed seed), each with the owner's own group.
std::vector<Entry> g_entries;

template <typename Fn>
Fn Next(const char *name) {
    return reinterpret_cast<Fn>(dlsym(RTLD_NEXT, name));
}

void OwnerNamesCached(benchmark::State &state) {
    long users = 0;
    long groups = 0;
    for (auto _ : state) {
        const long userBefore = g_userLookups.load();
        const long groupBefore = g_groupLookups.load();
        NvoEnum enumeration;  // a listing's lifetime: fresh caches
        NorvoUserEnum &names = enumeration.UserEnum();
        for (const Entry &entry : g_entries) {
            benchmark::DoNotOptimize(names.GetUserNameByUID(entry.uid));
            benchmark::DoNotOptimize(names.GetGroupNameByGID(entry.gid));
        }
        users = g_userLookups.load() - userBefore;
        groups = g_groupLookups.load() - groupBefore;
    }
    if (users > kOwners || groups > kOwners) {
        state.SkipWithError("more NSS lookups than distinct ids");
    }
    state.counters["nss_user_lookups"] = static_cast<double>(users);
    state.counters["nss_group_lookups"] = static_cast<double>(groups);
    state.counters["per_lookup"] = benchmark::Counter(
        2.0 * kEntries, benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

void OwnerNamesUncachedReference(benchmark::State &state) {
    long lookups = 0;
    for (auto _ : state) {
        const long before = g_userLookups.load() + g_groupLookups.load();
        for (int i = 0; i < kReferenceEntries; ++i) {
            PQUIBUSER userRecord = nullptr;
            PQUIBGROUP groupRecord = nullptr;
            benchmark::DoNotOptimize(QUIBUserGetByUID(g_entries[i].uid, &userRecord, 1));
            benchmark::DoNotOptimize(QUIBGroupGetByGID(g_entries[i].gid, &groupRecord, 1));
            QUIBUserFree(userRecord);
            QUIBGroupFree(groupRecord);
        }
        lookups = g_userLookups.load() + g_groupLookups.load() - before;
    }
    state.counters["nss_lookups"] = static_cast<double>(lookups);
    state.counters["per_lookup"] = benchmark::Counter(
        2.0 * kReferenceEntries, benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

BENCHMARK(OwnerNamesCached)->Unit(benchmark::kMillisecond);
BENCHMARK(OwnerNamesUncachedReference)->Unit(benchmark::kMillisecond);

}  // namespace

// Default visibility: the build hides symbols unless told, and a hidden one interposes nothing.
extern "C" __attribute__((visibility("default"))) int getpwuid_r(uid_t uid, passwd *record, char *buffer,
                                                                 size_t size, passwd **result) {
    using Fn = int (*)(uid_t, passwd *, char *, size_t, passwd **);
    static const Fn next = Next<Fn>("getpwuid_r");
    g_userLookups.fetch_add(1);
    return next(uid, record, buffer, size, result);
}

extern "C" __attribute__((visibility("default"))) int getgrgid_r(gid_t gid, group *record, char *buffer,
                                                                 size_t size, group **result) {
    using Fn = int (*)(gid_t, group *, char *, size_t, group **);
    static const Fn next = Next<Fn>("getgrgid_r");
    g_groupLookups.fetch_add(1);
    return next(gid, record, buffer, size, result);
}

int main(int argc, char **argv) {
    benchmark::Initialize(&argc, argv);
    norvo::testing::Appliance app;
    app.Basic();
    std::vector<Entry> owners;
    for (int i = 0; i < kOwners; ++i) {
        const std::string name = "owner" + std::to_string(i);
        norvo::testing::UserSpec user;
        user.name = name;
        user.groups = {"team" + std::to_string(i)};
        app.AddUser(user);
        owners.push_back({app.Uid(name), app.Gid("team" + std::to_string(i))});
    }
    std::mt19937 random(20240601);
    std::uniform_int_distribution<int> pick(0, kOwners - 1);
    for (int i = 0; i < kEntries; ++i) {
        g_entries.push_back(owners[static_cast<size_t>(pick(random))]);
    }
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
