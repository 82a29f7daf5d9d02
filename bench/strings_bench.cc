// The name matcher over 1,000,000 generated file names, per kind of search pattern. Reference:
// glibc's fnmatch with FNM_CASEFOLD, in the UTF-8 locale (so multi-byte names are characters to
// it, as to the matcher) and, for comparison, in the C locale (bytes only). The summary at the
// end gives ours / fnmatch per kind, in CPU time; below 1 is faster. The pathological pattern is timed on its
// own: fnmatch is left out there, its backtracking is what the matcher is built to avoid.
#include <fnmatch.h>
#include <locale.h>

#include <map>
#include <random>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include "norvo/norvomisc.h"

namespace {

constexpr int kNames = 1000000;

std::vector<std::string> g_names;

// Names as a photo and office share holds them: a word, a number, maybe a second word, and an
// extension in either case; about one in six has multi-byte characters.
std::vector<std::string> MakeNames() {
    const std::vector<std::string> words = {"IMG",     "DSC",     "Report",  "report",     "REPORT",
                                            "invoice", "Invoice", "budget",  "Urlaub",     "holiday",
                                            "backup",  "notes",   "Meeting", "draft",      "final",
                                            "scan",    "photo",   "video",   "Screenshot", "summary"};
    const std::vector<std::string> wide = {"r\xC3\xA9sum\xC3\xA9",
                                           "\xC3\x9C"
                                           "bersicht",
                                           "\xE5\x86\x99\xE7\x9C\x9F",
                                           "\xD0\x9E\xD1\x82\xD1\x87\xD1\x91\xD1\x82", "caf\xC3\xA9"};
    const std::vector<std::string> exts = {"jpg", "JPG", "png", "pdf", "PDF",    "docx", "xlsx",
                                           "mp4", "MOV", "txt", "zip", "tar.gz", "heic"};
    const char separators[] = {'_', '-', ' ', '.'};
    std::mt19937 rng(42);
    const auto pick = [&rng](const auto &list) { return list[rng() % list.size()]; };
    std::vector<std::string> names;
    names.reserve(kNames);
    for (int i = 0; i < kNames; ++i) {
        std::string name = rng() % 6 == 0 ? pick(wide) : pick(words);
        name += separators[rng() % 4];
        name += std::to_string(2000 + rng() % 25) + std::to_string(1000 + rng() % 9000);
        if (rng() % 3 == 0) {
            name += separators[rng() % 4];
            name += rng() % 6 == 0 ? pick(wide) : pick(words);
        }
        name += '.';
        name += pick(exts);
        names.push_back(std::move(name));
    }
    return names;
}

struct Kind {
    const char *name;
    const char *pattern;
};

const Kind kKinds[] = {
    {"substring", "*report*"},
    {"extension", "*.jpg"},
    {"mixed_case", "*InVoice*2021*"},
    {"question_marks", "IMG_????????.JPG"},
    {"multi_byte",
     "*\xC3\xBC"
     "bersicht*"},
};

void Ours(benchmark::State &state, const char *pattern) {
    long matched = 0;
    for (auto _ : state) {
        matched = 0;
        for (const std::string &name : g_names) {
            matched += NvoLibStrLikeCompare(pattern, name.c_str(), '\\');
        }
    }
    state.counters["matched"] = static_cast<double>(matched);
    state.counters["per_name"] = benchmark::Counter(
        kNames, benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

void Fnmatch(benchmark::State &state, const char *pattern, const char *locale) {
    if (setlocale(LC_ALL, locale) == nullptr) {
        state.SkipWithError("locale missing");
        return;
    }
    long matched = 0;
    for (auto _ : state) {
        matched = 0;
        for (const std::string &name : g_names) {
            matched += fnmatch(pattern, name.c_str(), FNM_CASEFOLD) == 0 ? 1 : 0;
        }
    }
    setlocale(LC_ALL, "C");
    state.counters["matched"] = static_cast<double>(matched);
    state.counters["per_name"] = benchmark::Counter(
        kNames, benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

void Pathological(benchmark::State &state) {
    const std::string subject(static_cast<size_t>(state.range(0)), 'a');
    for (auto _ : state) {
        benchmark::DoNotOptimize(NvoLibStrLikeCompare("*a*a*a*a*a*a*a*b", subject.c_str(), '\\'));
    }
}

// Prints the usual table, then ours / fnmatch per kind from the same run.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run> &runs) override {
        for (const Run &run : runs) {
            if (!run.error_occurred) {
                times_[run.benchmark_name()] = run.GetAdjustedCPUTime();  // the machine may be busy
            }
        }
        ConsoleReporter::ReportRuns(runs);
    }
    void Finalize() override {
        ConsoleReporter::Finalize();
        printf("\nours / fnmatch (FNM_CASEFOLD), per kind of pattern:\n");
        for (const Kind &kind : kKinds) {
            const double ours = Time(std::string("Ours/") + kind.name);
            const double utf8 = Time(std::string("Fnmatch_UTF8/") + kind.name);
            const double c = Time(std::string("Fnmatch_C/") + kind.name);
            printf("  %-15s %-22s UTF-8 locale %5.2f   C locale %5.2f\n", kind.name, kind.pattern,
                   ours / utf8, ours / c);
        }
    }

private:
    double Time(const std::string &name) const {
        const auto it = times_.find(name);
        return it != times_.end() ? it->second : 0.0 / 0.0;
    }
    std::map<std::string, double> times_;
};

}  // namespace

int main(int argc, char **argv) {
    benchmark::Initialize(&argc, argv);
    g_names = MakeNames();
    for (const Kind &kind : kKinds) {
        benchmark::RegisterBenchmark((std::string("Ours/") + kind.name).c_str(), Ours, kind.pattern)
            ->Unit(benchmark::kMillisecond);
        benchmark::RegisterBenchmark((std::string("Fnmatch_UTF8/") + kind.name).c_str(), Fnmatch,
                                     kind.pattern, "C.UTF-8")
            ->Unit(benchmark::kMillisecond);
        benchmark::RegisterBenchmark((std::string("Fnmatch_C/") + kind.name).c_str(), Fnmatch, kind.pattern,
                                     "C")
            ->Unit(benchmark::kMillisecond);
    }
    benchmark::RegisterBenchmark("Pathological/*a*a*a*a*a*a*a*b", Pathological)
        ->Arg(255)
        ->Arg(100000)
        ->Unit(benchmark::kMicrosecond);
    RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();
    return 0;
}
