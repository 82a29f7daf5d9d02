// Generated hostile trees and find(1) as a user: the reference of every walk and search test.
#pragma once
#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <random>
#include <string>
#include <vector>

#include "../platform/platform_test_util.h"
#include "appliance.h"

namespace norvo::testing {

// Makes the tree relative to descriptors, so that it may be deeper than PATH_MAX: hidden
// names, control bytes, invalid UTF-8, links up, dangling and out of the share.
class TreeMaker {
public:
    explicit TreeMaker(uint32_t seed) : random_(seed) {}

    void Build(int dir, int depth) {
        static const char *const kNames[] = {"a",      "B",           "b",        ".dot",   "@eaDir",
                                             ".DS_Store", "line\nbreak", "\xff\xfe", "sp ace", "@tmp", "Ünïcode"};
        const int count = depth == 0 ? 24 : std::uniform_int_distribution<int>(0, 6)(random_);
        for (int i = 0; i < count; ++i) {
            const std::string name = std::string(kNames[Pick(std::size(kNames))]) + (Pick(2) ? std::to_string(Pick(3)) : "");
            switch (Pick(depth < 4 ? 6 : 3)) {
            case 0:
                close(openat(dir, name.c_str(), O_CREAT | O_WRONLY, 0644));
                break;
            case 1:
                (void)!symlinkat(Pick(2) ? ".." : "gone", dir, name.c_str());
                break;
            case 2:
                (void)!symlinkat("/volume1/photo", dir, name.c_str());
                break;
            default:
                if (mkdirat(dir, name.c_str(), 0755) == 0) {
                    const int child = openat(dir, name.c_str(), O_RDONLY | O_DIRECTORY);
                    Build(child, depth + 1);
                    close(child);
                }
            }
        }
    }
    size_t Pick(size_t n) { return std::uniform_int_distribution<size_t>(0, n - 1)(random_); }

private:
    std::mt19937 random_;
};

// The find(1) clause that leaves out what no walk visits: the names the platform hides (and
// their subtrees) and, with recycle, the share's recycle bin below top.
inline std::string FindPrune(const std::string &top, bool recycle) {
    return std::string("\\( -name @eaDir -o -name @tmp -o -name .DS_Store -o -name @sharebin ") +
           "-o -name '#snapshot'" + (recycle ? " -o -path '" + top + "/#recycle'" : "") + " \\) -prune -o ";
}

// Runs `find -P tops -mindepth 1 <prune> <tests> -printf format` as user and gives its records
// (NUL-terminated), leaving out those whose folder user may not enter and read: find lists a
// folder it may read but not enter, a walk passes it over.
inline std::vector<std::string> FindAs(Appliance &app, const std::string &user, const std::string &tops,
                                       const std::string &prune, const std::string &tests,
                                       const std::string &format = "%p") {
    const std::string out = "/tmp/find." + user + ".out", kept = "/tmp/find." + user + ".kept";
    const std::string command = "find -P " + tops + " -mindepth 1 " + prune + tests + " -printf '%h\\t" +
                                format + "\\0' >" + out + " 2>/dev/null";
    app.RunAs(user, [&] {
        if (system(command.c_str()) == -1) {
            return 1;
        }
        std::string list;
        const std::string all = ReadFile(out);
        for (size_t at = 0, end; (end = all.find('\0', at)) != std::string::npos; at = end + 1) {
            const size_t tab = all.find('\t', at);
            if (access(all.substr(at, tab - at).c_str(), R_OK | X_OK) == 0 || errno != EACCES) {
                list += all.substr(tab + 1, end - tab);
            }
        }
        std::ofstream(kept, std::ios::binary) << list;
        return 0;
    });
    std::vector<std::string> found;
    const std::string list = ReadFile(kept);
    for (size_t at = 0, end; (end = list.find('\0', at)) != std::string::npos; at = end + 1) {
        found.push_back(list.substr(at, end - at));
    }
    return found;
}

}  // namespace norvo::testing
