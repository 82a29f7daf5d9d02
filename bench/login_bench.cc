// Authorising a sharing-link visitor with 100, 1,000 and 10,000 live sessions in the session
// file, which every authorisation reads and rewrites whole (through a scratch file and rename).
//
// Reference, measured in the same run: the floor, a plain function that reads the file and
// renames a rewritten copy of the same size over it. Counter "x_floor": time over the floor at
// the same size; goal <= 1.5 at every size.
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

namespace {

const std::string kFile = "/tmp/foldersharing.current.users";
const std::string kScratch = kFile + ".tmp";
std::map<int64_t, double> g_floor;  // seconds per call, by sessions

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

void Floor(benchmark::State &state) {
    WriteSessions(state.range(0));
    std::string text;
    for (auto _ : state) {
        text.clear();
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
            const auto sessions = std::stoll(run.run_name.args);
            if (run.run_name.function_name == "Floor") {
                g_floor[sessions] = seconds;
            } else if (run.run_name.function_name == "Authorize" && g_floor.count(sessions)) {
                run.counters["x_floor"] = seconds / g_floor[sessions];
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
