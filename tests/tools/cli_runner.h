// Runs the built norvo command and collects what it says.
//
// The binary is found next to the test: build/tests/<test> runs build/tools/norvo (the tests'
// CMakeLists puts every test executable in build/tests, the tools' puts norvo in build/tools).
// NORVO_CLI in the environment overrides that path. Inside the appliance the build tree is
// reachable to every user wherever the checkout is, so RunAs children can run it too.
#pragma once

#include <fcntl.h>
#include <limits.h>
#include <poll.h>
#include <signal.h>
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

// Writes input to fd and reads both output pipes until they close, so neither side can block
// on a full pipe.
inline void Pump(int inFd, const std::string &input, int outFd, int errFd, CliResult *result) {
    size_t written = 0;
    if (input.empty()) {
        close(inFd);
        inFd = -1;
    }
    while (outFd >= 0 || errFd >= 0) {
        pollfd fds[3] = {{outFd, POLLIN, 0}, {errFd, POLLIN, 0}, {inFd, POLLOUT, 0}};
        if (poll(fds, 3, -1) < 0) {
            if (errno == EINTR) continue;
            break;
        }
        char buf[65536];
        int *readFds[2] = {&outFd, &errFd};
        std::string *sinks[2] = {&result->out, &result->err};
        for (int i = 0; i < 2; ++i) {
            if (*readFds[i] >= 0 && fds[i].revents != 0) {
                const ssize_t got = read(*readFds[i], buf, sizeof buf);
                if (got > 0) {
                    sinks[i]->append(buf, static_cast<size_t>(got));
                } else if (got == 0 || errno != EINTR) {
                    close(*readFds[i]);
                    *readFds[i] = -1;
                }
            }
        }
        if (inFd >= 0 && fds[2].revents != 0) {
            const ssize_t put = write(inFd, input.data() + written, input.size() - written);
            if (put > 0) written += static_cast<size_t>(put);
            if (put < 0 || written == input.size()) {
                close(inFd);
                inFd = -1;
            }
        }
    }
    if (inFd >= 0) close(inFd);
}

}  // namespace internal

// Runs norvo with args (argv[0] is added) and input on its stdin.
inline CliResult RunNorvo(const std::vector<std::string> &args, const std::string &input = "") {
    CliResult result;
    const std::string binary = NorvoCliPath();
    std::vector<std::string> owned;
    owned.push_back(binary);
    owned.insert(owned.end(), args.begin(), args.end());
    std::vector<char *> argv;
    for (std::string &arg : owned) argv.push_back(arg.data());
    argv.push_back(nullptr);

    int in[2], out[2], err[2];
    if (pipe2(in, O_CLOEXEC) != 0 || pipe2(out, O_CLOEXEC) != 0 || pipe2(err, O_CLOEXEC) != 0) {
        result.err = "pipe failed";
        return result;
    }
    signal(SIGPIPE, SIG_IGN);  // a command that stops reading its stdin must not kill the test
    const pid_t pid = fork();
    if (pid == 0) {
        dup2(in[0], 0);
        dup2(out[1], 1);
        dup2(err[1], 2);
        execv(argv[0], argv.data());
        _exit(127);
    }
    close(in[0]);
    close(out[1]);
    close(err[1]);
    if (pid < 0) {
        close(in[1]);
        close(out[0]);
        close(err[0]);
        result.err = "fork failed";
        return result;
    }
    internal::Pump(in[1], input, out[0], err[0], &result);
    int status = 0;
    while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
    }
    if (WIFEXITED(status)) {
        result.exitStatus = WEXITSTATUS(status);
    } else if (WIFSIGNALED(status)) {
        result.signal = WTERMSIG(status);
    }
    return result;
}

}  // namespace norvo::testing
