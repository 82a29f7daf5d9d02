// The directory walker as a search uses it: Walk_TopDown over a tree with a callback that tests
// each name against a pattern with fnmatch and counts the matches.
//   walk_norvo REAL-DIR USER-DIR PATTERN           prints the number of names that match
//   walk_norvo --diag REAL-DIR USER-DIR PATTERN    also the deepest level, the descriptors open
//                                                  when it was first reached, and peak memory
// --diag counts /proc/self/fd at each new deepest level, which costs time: a run apart from the
// timed ones.
#include <dirent.h>
#include <fnmatch.h>
#include <stdio.h>
#include <string.h>
#include <sys/resource.h>

#include <algorithm>
#include <string>

#include "norvo/norvodir.h"

namespace {

int OpenDescriptors() {
    DIR *fds = opendir("/proc/self/fd");
    if (fds == nullptr) {
        return -1;
    }
    int count = 0;
    while (const struct dirent *entry = readdir(fds)) {
        count += entry->d_name[0] != '.' ? 1 : 0;
    }
    closedir(fds);
    return count - 1;  // the one reading them
}

class Count : public NvoDirectoryWalkerCallBack {
public:
    Count(const char *pattern, bool diag, size_t topDepth)
        : pattern_(pattern), diag_(diag), topDepth_(topDepth) {}

    bool operator()(const std::string &userPath, const std::string &, const std::string &,
                    const std::string &name, QUIBSTAT &, const std::string *) override {
        if (fnmatch(pattern_, name.c_str(), 0) == 0) {
            ++matches_;
        }
        if (diag_) {
            const size_t depth =
                static_cast<size_t>(std::count(userPath.begin(), userPath.end(), '/')) - topDepth_;
            if (depth > deepest_) {
                deepest_ = depth;
                descriptors_ = OpenDescriptors();
            }
        }
        return true;
    }

    long matches_ = 0;
    size_t deepest_ = 0;
    int descriptors_ = 0;

private:
    const char *pattern_;
    const bool diag_;
    const size_t topDepth_;
};

}  // namespace

int main(int argc, char **argv) {
    const bool diag = argc == 5 && strcmp(argv[1], "--diag") == 0;
    if (argc != 4 + (diag ? 1 : 0)) {
        fprintf(stderr, "usage: walk_norvo [--diag] REAL-DIR USER-DIR PATTERN\n");
        return 2;
    }
    const std::string realDir = argv[argc - 3];
    const std::string userDir = argv[argc - 2];
    Count count(argv[argc - 1], diag, static_cast<size_t>(std::count(userDir.begin(), userDir.end(), '/')));
    const int before = OpenDescriptors();
    NvoDirectoryWalker walker(IGNORE_ERR_PERMISSION, nullptr);
    if (!walker.Walk_TopDown(userDir, userDir, realDir, count, nullptr, false)) {
        fprintf(stderr, "walk_norvo: the walk failed\n");
        return 1;
    }
    printf("%ld\n", count.matches_);
    if (diag) {
        struct rusage usage;
        getrusage(RUSAGE_SELF, &usage);
        printf("deepest level %zu, descriptors open there %d (before the walk %d), peak memory %.1f MiB\n",
               count.deepest_, count.descriptors_, before, usage.ru_maxrss / 1024.0);
    }
    return 0;
}
