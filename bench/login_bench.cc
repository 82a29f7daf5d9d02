// Authorising a sharing-link visitor with 100, 1,000 and 10,000 live sessions in the session
// file, which every authorisation reads and rewrites whole (through a scratch file and rename).
//
// Reference, measured in the same run: the floor, a plain function that reads the file and
// renames a rewritten copy of the same size over it. Counter "x_floor": time over the floor at
// the same size; goal <= 1.5 at every size.
// Every CGI request is a new process: "AuthorizeFresh" and "FloorFresh" fork a child for each
// call (the fork is in both), so nothing one call leaves behind helps the next. "Lookups" is
// the part no file size changes: the lock, the clock, the blocking check and the account,
// expiry, application-privilege and administrator lookups one authorisation makes (it runs
// last, as its second half leaves the blocking database behind).
// Logins sleep a second for each id they try: "Login" shows one login's wall time and
// "Login8" the wall time of eight at once (logins per second = 8 / that).
#include <fcntl.h>
#include <stdlib.h>
#include <sys/sysinfo.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <map>
#include <string>

#include <benchmark/benchmark.h>

#include "appliance.h"
#include "norvo/norvologin.h"
#include "quib_autoblock.h"
#include "quib_cgi.h"
#include "quib_user.h"

namespace {

const std::string kFile = "/tmp/foldersharing.current.users";
const std::string kScratch = kFile + ".tmp";
std::map<int64_t, double> g_floor;  // seconds per call, by sessions (negative: fresh process)

// n live sessions of alice from 192.0.2.1, the one authorised ("SESSION0000000") in the middle.
void WriteSessions(int64_t n) {
    struct sysinfo info;
    sysinfo(&info);
    std::string text;
    for (int64_t i = 0; i < n; ++i) {
        char line[160];
        snprintf(line, sizeof line, "192.0.2.1,alice,%s%07lld,%ld,%ld,2,0,L\n",
                 i == n / 2 ? "SESSION" : "other00", static_cast<long long>(i == n / 2 ? 0 : i), info.uptime,
                 info.uptime);
        text += line;
    }
    const int fd = open(kFile.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
    if (fd < 0 || write(fd, text.data(), text.size()) != static_cast<ssize_t>(text.size()) ||
        close(fd) != 0) {
        abort();
    }
}

void FloorOnce(benchmark::State &state) {
    std::string text;
    const int in = open(kFile.c_str(), O_RDONLY | O_CLOEXEC);
    char buf[65536];
    for (ssize_t got; (got = read(in, buf, sizeof buf)) > 0;)
        text.append(buf, static_cast<size_t>(got));
    close(in);
    const int out = open(kScratch.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    if (write(out, text.data(), text.size()) != static_cast<ssize_t>(text.size()) || close(out) != 0 ||
        rename(kScratch.c_str(), kFile.c_str()) != 0) {
        state.SkipWithError("floor failed");
    }
}

void Floor(benchmark::State &state) {
    WriteSessions(state.range(0));
    for (auto _ : state) {
        FloorOnce(state);
    }
}

bool AuthorizeOnce() {
    QUIB::WebCGI cgi;
    const int sink = open("/dev/null", O_WRONLY);
    cgi.Init(-1, sink);
    CONFIRM_POLICY policy = {15, 0};
    char user[64];
    const int result = NorvoLogin::IsAuthorizedByPath(&cgi, "SESSION0000000", user, sizeof user, &policy,
                                                      CGI_POSITION_FILE_BROWSER, "L");
    close(sink);
    return result == 1;
}

// Runs fn in a child process, once per iteration.
template <typename F>
void InChild(benchmark::State &state, F fn) {
    for (auto _ : state) {
        const pid_t child = fork();
        if (child == 0) {
            _exit(fn() ? 0 : 1);
        }
        int status = -1;
        if (child < 0 || waitpid(child, &status, 0) != child || status != 0) {
            state.SkipWithError("child failed");
        }
    }
}

void FloorFresh(benchmark::State &state) {
    WriteSessions(state.range(0));
    InChild(state, [&state] {
        FloorOnce(state);
        return true;
    });
}

void AuthorizeFresh(benchmark::State &state) {
    WriteSessions(state.range(0));
    setenv("REQUEST_METHOD", "GET", 1), setenv("REMOTE_ADDR", "192.0.2.1", 1);
    InChild(state, AuthorizeOnce);
}

// Arg 1: with the blocking database present (any failure anywhere makes it), as it mostly is.
void Lookups(benchmark::State &state) {
    if (state.range(0) == 1 && AutoBlockFailLoginSet("198.51.100.1", "FOLDER_SHARING") != 0) {
        state.SkipWithError("no blocking database");
    }
    for (auto _ : state) {
        const int lock = QuibCgiBeginCriticalSection("/tmp/foldersharing.current.users.lock", 30000);
        struct sysinfo info;
        sysinfo(&info);
        benchmark::DoNotOptimize(VLIBCConfGetOBXTimeout());
        PQUIBUSER user = nullptr;
        if (QuibCgiIsDeniedIP("192.0.2.1") != 0 || QUIBUserGet("alice", &user) != 0 ||
            QUIBUserIsExpired("alice") != 0 ||
            VLIBUserPrivilegeHas("alice", "QUIB.TVQ.App.Tovana3.Instance") != 1 ||
            QUIBGroupIsAdminGroupMem("alice") != 0) {
            state.SkipWithError("lookup failed");
        }
        QUIBUserFree(user);
        QuibCgiEndCriticalSection(lock);
    }
}

void Authorize(benchmark::State &state) {
    WriteSessions(state.range(0));
    setenv("REQUEST_METHOD", "GET", 1), setenv("REMOTE_ADDR", "192.0.2.1", 1);
    QUIB::WebCGI cgi;
    const int sink = open("/dev/null", O_WRONLY);
    cgi.Init(-1, sink);
    CONFIRM_POLICY policy = {15, 0};
    char user[64];
    for (auto _ : state) {
        if (NorvoLogin::IsAuthorizedByPath(&cgi, "SESSION0000000", user, sizeof user, &policy,
                                           CGI_POSITION_FILE_BROWSER, "L") != 1) {
            state.SkipWithError("not authorised");
        }
    }
    close(sink);
}

void Login(benchmark::State &state) {
    const int processes = static_cast<int>(state.range(0));
    for (auto _ : state) {
        for (int p = 0; p < processes; ++p) {
            if (fork() == 0) {
                setenv("REQUEST_METHOD", "GET", 1);
                setenv("REMOTE_ADDR", ("192.0.2." + std::to_string(10 + p)).c_str(), 1);
                QUIB::WebCGI cgi;
                const int sink = open("/dev/null", O_WRONLY);
                cgi.Init(-1, sink);
                LOGIN_PARAMS params = {"alice", "Anomyous", "folderSharing", 15, 0};
                char session[64];
                _exit(NorvoLogin::FolderSharingLoginManager().login(&cgi, session, sizeof session, &params,
                                                                    "L") == 1
                          ? 0
                          : 1);
            }
        }
        int failed = 0;
        for (int p = 0; p < processes; ++p) {
            int status = -1;
            wait(&status);
            failed += status != 0;
        }
        if (failed != 0) {
            state.SkipWithError("a login failed");
        }
    }
    state.counters["logins_per_s"] =
        benchmark::Counter(static_cast<double>(processes) * state.iterations(), benchmark::Counter::kIsRate);
}

// Google Benchmark reports each run separately; the ratio needs the floor's time, so the floor
// runs first and its result is kept here.
class Keeper : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run> &runs) override {
        std::vector<Run> shown = runs;
        for (Run &run : shown) {
            const double seconds = run.GetAdjustedRealTime() / 1e9;  // ns
            const auto sessions = run.run_name.args.empty() ? 0 : std::stoll(run.run_name.args);
            const std::string &name = run.run_name.function_name;
            if (name == "Floor" || name == "FloorFresh") {
                g_floor[name == "Floor" ? sessions : -sessions] = seconds;
            } else if (name == "Authorize" && g_floor.count(sessions)) {
                run.counters["x_floor"] = seconds / g_floor[sessions];
            } else if (name == "AuthorizeFresh" && g_floor.count(-sessions)) {
                run.counters["x_floor"] = seconds / g_floor[-sessions];
            }
        }
        ConsoleReporter::ReportRuns(shown);
    }
};

}  // namespace

int main(int argc, char **argv) {
    norvo::testing::Appliance appliance;
    appliance.Basic().SetAppPrivilege("QUIB.TVQ.App.Tovana3.Instance", "@users");
    benchmark::Initialize(&argc, argv);
    for (const int64_t n : {100, 1000, 10000}) {
        benchmark::RegisterBenchmark("Floor", Floor)->Arg(n)->Unit(benchmark::kMicrosecond);
        benchmark::RegisterBenchmark("Authorize", Authorize)->Arg(n)->Unit(benchmark::kMicrosecond);
    }
    for (const int64_t n : {100, 1000, 10000}) {
        benchmark::RegisterBenchmark("FloorFresh", FloorFresh)
            ->Arg(n)
            ->Unit(benchmark::kMicrosecond)
            ->UseRealTime();
        benchmark::RegisterBenchmark("AuthorizeFresh", AuthorizeFresh)
            ->Arg(n)
            ->Unit(benchmark::kMicrosecond)
            ->UseRealTime();
    }
    benchmark::RegisterBenchmark("Lookups", Lookups)->Arg(0)->Arg(1)->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("Login", Login)
        ->Arg(1)
        ->Iterations(2)
        ->Unit(benchmark::kMillisecond)
        ->UseRealTime();
    benchmark::RegisterBenchmark("Login", Login)
        ->Arg(8)
        ->Iterations(2)
        ->Unit(benchmark::kMillisecond)
        ->UseRealTime();
    Keeper reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();
    return 0;
}
