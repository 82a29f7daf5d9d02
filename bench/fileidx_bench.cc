// The file index's result databases with 100,000 hits.
//
// References, measured in the same run:
//  - Insert: the floor is the same rows bound to one prepared statement in one transaction,
//    straight through SQLite, against the walk's path (FILEIDXOutputDBOpen, one
//    FILEIDXOutputDBInsert per hit, FILEIDXOutputDBClose). Goal: x_floor <= 1.5 (cpu_x_floor:
//    the same in CPU time, steadier on a loaded machine).
//  - Page: 100 hits at offset 50,000 sorted by name (FILEIDXDBSelect), against the same query
//    in the sqlite3 shell on the same file (SQLite's NOCASE collation, process start included).
//    Goal: x_shell <= 1.2.
//  - The same two through a search task (NvoSearchDBTask): each hit made from a real path and
//    a stat record by the task's own record filling (split, permission text, type) and
//    inserted with FILEIDXOutputDBInsert, against the floor; and queryResult's page (the count
//    of all hits included), against the shell.
#include <sqlite3.h>
#include <stdio.h>
#include <string.h>
#include <time.h>
#include <unistd.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include <benchmark/benchmark.h>

#include "appliance.h"
#include "fileidx.h"
#include "norvo/searchdb.h"
#include "norvosearch/search_db_record.h"
#include "vlibc_exec.h"

namespace {

constexpr int kHits = 100000;
const std::string kPageDb = "/volume1/public/page.db";
double g_floorSeconds = 0, g_floorCpu = 0, g_shellSeconds = 0;

// The hit the walk would store for entry i (names in mixed case, many folders).
void MakeHit(int i, FI_FILE_INFO_DATA *r) {
    snprintf(r->name, sizeof r->name, "%s%06d.jpg", i % 3 ? "img_" : "IMG_", (i * 7919) % kHits);
    snprintf(r->parentPath, sizeof r->parentPath, "photos/%03d", i % 500);
    snprintf(r->path, sizeof r->path, "photos/%03d/%.200s", i % 500, r->name);
    snprintf(r->share, sizeof r->share, "photo");
    snprintf(r->realPath, sizeof r->realPath, "/volume1/photo");
    snprintf(r->type, sizeof r->type, "jpg");
    snprintf(r->posix, sizeof r->posix, "rw-r--r--");
    snprintf(r->userName, sizeof r->userName, "alice");
    snprintf(r->groupName, sizeof r->groupName, "users");
    r->size = i * 37;
    r->crtime = r->ctime = r->atime = r->mtime = 1600000000 + i;
    r->mode = 0100644, r->uid = 1000, r->gid = 100;
}

std::string FreshDb(const std::string &name) {
    const std::string path = "/volume1/public/" + name;
    for (const char *suffix : {"", "-wal", "-shm"}) {
        unlink((path + suffix).c_str());
    }
    if (FILEIDXDBCreate(path.c_str()) != 0) {
        abort();
    }
    return path;
}

void InsertThroughOutput(const std::string &path) {
    static FI_FILE_INFO_DATA hit;
    FI_OUTPUT_DB *out = nullptr;
    bool ok = FILEIDXOutputDBOpen(path.c_str(), &out) == 0;
    for (int i = 0; ok && i < kHits; ++i) {
        MakeHit(i, &hit);
        ok = FILEIDXOutputDBInsert(out, &hit) == 0;
    }
    if (FILEIDXOutputDBClose(out) != 0 || !ok) {
        abort();
    }
}

void InsertFloor(const std::string &path) {
    static FI_FILE_INFO_DATA hit;
    sqlite3 *db = nullptr;
    sqlite3_stmt *insert = nullptr;
    sqlite3_open_v2(path.c_str(), &db, SQLITE_OPEN_READWRITE, nullptr);
    sqlite3_exec(db, "BEGIN", nullptr, nullptr, nullptr);
    sqlite3_prepare_v2(
        db,
        "INSERT INTO fileinfo(name, real_path, parent_path, share, path, is_dir, size, type, crtime, "
        "ctime, atime, mtime, posix, mode, uid, gid, user_name, group_name) "
        "VALUES(?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?)",
        -1, &insert, nullptr);
    for (int i = 0; i < kHits; ++i) {
        MakeHit(i, &hit);
        int n = 0;
        for (const char *text : {hit.name, hit.realPath, hit.parentPath, hit.share, hit.path}) {
            sqlite3_bind_text(insert, ++n, text, -1, SQLITE_STATIC);
        }
        sqlite3_bind_int64(insert, ++n, hit.isDir);
        sqlite3_bind_int64(insert, ++n, hit.size);
        sqlite3_bind_text(insert, ++n, hit.type, -1, SQLITE_STATIC);
        for (const long long t : {hit.crtime, hit.ctime, hit.atime, hit.mtime}) {
            sqlite3_bind_int64(insert, ++n, t);
        }
        sqlite3_bind_text(insert, ++n, hit.posix, -1, SQLITE_STATIC);
        for (const long long v : {0LL + hit.mode, 0LL + hit.uid, 0LL + hit.gid}) {
            sqlite3_bind_int64(insert, ++n, v);
        }
        sqlite3_bind_text(insert, ++n, hit.userName, -1, SQLITE_STATIC);
        sqlite3_bind_text(insert, ++n, hit.groupName, -1, SQLITE_STATIC);
        if (sqlite3_step(insert) != SQLITE_DONE) {
            abort();
        }
        sqlite3_reset(insert);
    }
    sqlite3_finalize(insert);
    if (sqlite3_exec(db, "COMMIT", nullptr, nullptr, nullptr) != SQLITE_OK) {
        abort();
    }
    sqlite3_close(db);
}

// The walk's path through the task: the real path and status of entry i become its record.
void InsertThroughTask(const std::string &path) {
    static FI_FILE_INFO_DATA hit, names;
    FI_OUTPUT_DB *out = nullptr;
    bool ok = FILEIDXOutputDBOpen(path.c_str(), &out) == 0;
    std::string root, rest;
    for (int i = 0; ok && i < kHits; ++i) {
        MakeHit(i, &names);
        _tag_QUIBSTAT_ st{};
        st.st_mode = 0100644;
        st.st_size = names.size;
        st.st_mtim.tv_sec = st.st_atim.tv_sec = st.st_ctim.tv_sec = static_cast<int32_t>(names.mtime);
        const std::string real = std::string("/volume1/photo/") + names.path;
        ok = norvo::search::SplitRealPath(real, &root, &rest) == norvo::search::SplitResult::kOk;
        norvo::search::FillHit(norvo::search::KeyShare("photo"), root, rest, st, &hit);
        memcpy(hit.userName, names.userName, sizeof hit.userName);  // the walk's name caches
        memcpy(hit.groupName, names.groupName, sizeof hit.groupName);
        ok = ok && FILEIDXOutputDBInsert(out, &hit) == 0;
    }
    if (FILEIDXOutputDBClose(out) != 0 || !ok) {
        abort();
    }
}

double CpuNow() {
    timespec now{};
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
}

// Wall seconds per iteration of fn (*cpu: CPU seconds), a fresh database made before each
// outside the timing.
template <typename Fn>
double TimeInserts(benchmark::State &state, Fn fn, double *cpu) {
    double elapsed = 0, used = 0;
    for (auto _ : state) {
        state.PauseTiming();
        const std::string path = FreshDb("insert.db");
        state.ResumeTiming();
        const double cpuStart = CpuNow();
        const auto start = std::chrono::steady_clock::now();
        fn(path);
        elapsed += std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
        used += CpuNow() - cpuStart;
    }
    *cpu = used / static_cast<double>(state.iterations());
    return elapsed / static_cast<double>(state.iterations());
}

void InsertFloorBench(benchmark::State &state) {
    g_floorSeconds = TimeInserts(state, InsertFloor, &g_floorCpu);
}

void InsertOutputBench(benchmark::State &state) {
    double cpu = 0;
    const double seconds = TimeInserts(state, InsertThroughOutput, &cpu);
    if (g_floorSeconds > 0) {
        state.counters["x_floor"] = seconds / g_floorSeconds;
        state.counters["cpu_x_floor"] = cpu / g_floorCpu;
    }
}

void InsertTaskBench(benchmark::State &state) {
    double cpu = 0;
    const double seconds = TimeInserts(state, InsertThroughTask, &cpu);
    if (g_floorSeconds > 0) {
        state.counters["x_floor"] = seconds / g_floorSeconds;
        state.counters["cpu_x_floor"] = cpu / g_floorCpu;
    }
}

double TimePages(benchmark::State &state, const std::function<bool()> &page) {
    double elapsed = 0;
    for (auto _ : state) {
        const auto start = std::chrono::steady_clock::now();
        if (!page()) {
            state.SkipWithError("the page failed");
            return 0;
        }
        elapsed += std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    }
    return elapsed / static_cast<double>(state.iterations());
}

void PageShellBench(benchmark::State &state) {
    const char *argv[] = {
        "sqlite3",
        "-readonly",
        kPageDb.c_str(),
        ".output /dev/null",
        "SELECT * FROM fileinfo ORDER BY name COLLATE NOCASE, rowid LIMIT 100 OFFSET 50000;",
        nullptr};
    g_shellSeconds = TimePages(state, [&] { return VLIBCExec("/usr/bin/sqlite3", argv) == 0; });
}

void PageBench(benchmark::State &state) {
    const FI_QUERY query{nullptr, 1, {{FI_COND_NAME, 0}}};
    const unsigned long long limit = 100, offset = 50000;
    const double seconds = TimePages(state, [&] {
        int hits = 0;
        const auto count = [](FI_FILE_INFO_DATA *, void *arg) { return ++*static_cast<int *>(arg), 1; };
        return FILEIDXDBSelect(kPageDb.c_str(), &query, count, &hits, &limit, &offset, 0) == 0 && hits == 100;
    });
    if (g_shellSeconds > 0) {
        state.counters["x_shell"] = seconds / g_shellSeconds;
    }
}

std::unique_ptr<NvoSearchDBTask> g_task;

void TaskPageBench(benchmark::State &state) {
    const bool desc = false;
    const double seconds = TimePages(state, [&] {
        int hits = 0;
        unsigned long long total = 0;
        const auto count = [](FI_FILE_INFO_DATA *, void *arg) { return ++*static_cast<int *>(arg), 1; };
        return g_task->queryResult(50000, 100, "name", &desc, nullptr, nullptr, count, &hits, &total) &&
               hits == 100 && total == kHits;
    });
    if (g_shellSeconds > 0) {
        state.counters["x_shell"] = seconds / g_shellSeconds;
    }
}

}  // namespace

int main(int argc, char **argv) {
    benchmark::Initialize(&argc, argv);
    norvo::testing::Appliance appliance;
    appliance.Basic();
    InsertThroughOutput(FreshDb("page.db"));
    g_task.reset(NvoSearchDBTaskMgr("alice").createDBTask("/volume1", nullptr));
    if (!g_task || FILEIDXDBCreate(g_task->getDBTaskFilePath().c_str()) != 0) {
        abort();
    }
    InsertThroughTask(g_task->getDBTaskFilePath());
    benchmark::RegisterBenchmark("InsertFloor", InsertFloorBench)
        ->Unit(benchmark::kMillisecond)
        ->Iterations(5);
    benchmark::RegisterBenchmark("FILEIDXOutputDBInsert", InsertOutputBench)
        ->Unit(benchmark::kMillisecond)
        ->Iterations(5);
    benchmark::RegisterBenchmark("TaskWalkInsert", InsertTaskBench)
        ->Unit(benchmark::kMillisecond)
        ->Iterations(5);
    benchmark::RegisterBenchmark("PageInSqliteShell", PageShellBench)
        ->Unit(benchmark::kMillisecond)
        ->Iterations(10);
    benchmark::RegisterBenchmark("FILEIDXDBSelectPage", PageBench)
        ->Unit(benchmark::kMillisecond)
        ->Iterations(10);
    benchmark::RegisterBenchmark("TaskQueryResultPage", TaskPageBench)
        ->Unit(benchmark::kMillisecond)
        ->Iterations(10);
    benchmark::RunSpecifiedBenchmarks();
    g_task.reset();
    benchmark::Shutdown();
    return 0;
}
