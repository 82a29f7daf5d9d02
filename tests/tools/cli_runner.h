// Runs the built norvo command and collects what it says.
//
// The binary is found next to the test: build/tests/<test> runs build/tools/norvo (the tests'
// CMakeLists puts every test executable in build/tests, the tools' puts norvo in build/tools).
// NORVO_CLI in the environment overrides that path. Inside the appliance the build tree is
// reachable to every user wherever the checkout is, so RunAs children can run it too.
#pragma once

#include <fcntl.h>
#include <limits.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <string>
#include <vector>

namespace norvo::testing {

struct CliResult {
    int exitStatus = -1;  // -1 when the command did not exit normally (killed by a signal)
    int signal = 0;
    std::string out;
    std::string err;
};

inline std::string NorvoCliPath() {
    if (const char *given = getenv("NORVO_CLI")) {
        return given;
    }
    char self[PATH_MAX];
    const ssize_t n = readlink("/proc/self/exe", self, sizeof self - 1);
    if (n <= 0) {
        return "";
    }
    std::string dir(self, static_cast<size_t>(n));
    dir.erase(dir.rfind('/'));
    return dir + "/../tools/norvo";
}

namespace internal {

inline std::string ReadWhole(int fd) {
    std::string text;
    char buf[65536];
    for (ssize_t got; (got = pread(fd, buf, sizeof buf, static_cast<off_t>(text.size()))) > 0;) {
        text.append(buf, static_cast<size_t>(got));
    }
    return text;
}

}  // namespace internal

// Runs norvo with args (argv[0] is added) and input on its stdin. The command's streams are
// files in memory: neither side can block on a full pipe, and a command that leaves its input
// unread is no matter.
inline CliResult RunNorvo(const std::vector<std::string> &args, const std::string &input = "") {
    CliResult result;
    std::vector<std::string> owned{NorvoCliPath()};
    owned.insert(owned.end(), args.begin(), args.end());
    std::vector<char *> argv;
    for (std::string &arg : owned) argv.push_back(arg.data());
    argv.push_back(nullptr);

    const int fds[3] = {memfd_create("in", MFD_CLOEXEC), memfd_create("out", MFD_CLOEXEC),
                        memfd_create("err", MFD_CLOEXEC)};
    const bool ready = fds[0] >= 0 && fds[1] >= 0 && fds[2] >= 0 &&
                       pwrite(fds[0], input.data(), input.size(), 0) == static_cast<ssize_t>(input.size());
    const pid_t pid = ready ? fork() : -1;
    if (pid == 0) {
        for (int i = 0; i < 3; ++i) dup2(fds[i], i);
        execv(argv[0], argv.data());
        _exit(127);
    }
    int status = 0;
    while (pid > 0 && waitpid(pid, &status, 0) < 0 && errno == EINTR) {
    }
    if (pid < 0) {
        result.err = "memfd or fork failed";
    } else if (WIFEXITED(status)) {
        result.exitStatus = WEXITSTATUS(status);
    } else if (WIFSIGNALED(status)) {
        result.signal = WTERMSIG(status);
    }
    result.out = fds[1] >= 0 ? internal::ReadWhole(fds[1]) : "";
    result.err += fds[2] >= 0 ? internal::ReadWhole(fds[2]) : "";
    for (int fd : fds) {
        if (fd >= 0) close(fd);
    }
    return result;
}

}  // namespace norvo::testing
