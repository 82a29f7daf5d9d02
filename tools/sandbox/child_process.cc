#include "child_process.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <utility>

#include "fail.h"

namespace norvo::testing::internal {

namespace {

constexpr int kGraceMilliseconds = 5000;

void SleepMilliseconds(long ms) {
    timespec delay{ms / 1000, (ms % 1000) * 1000000L};
    while (nanosleep(&delay, &delay) != 0 && errno == EINTR) {
    }
}

}  // namespace

ChildProcess::ChildProcess(ChildProcess &&other) noexcept : pid_(std::exchange(other.pid_, -1)) {}

ChildProcess &ChildProcess::operator=(ChildProcess &&other) noexcept {
    if (this != &other) {
        Stop();
        pid_ = std::exchange(other.pid_, -1);
    }
    return *this;
}

ChildProcess ChildProcess::Start(const std::vector<std::string> &argv, bool quiet) {
    // Everything the child needs is prepared before fork: the parent may have threads.
    std::vector<char *> args;
    for (const auto &arg : argv)
        args.push_back(const_cast<char *>(arg.c_str()));
    args.push_back(nullptr);
    const pid_t parent = getpid();
    fflush(nullptr);
    const pid_t pid = fork();
    if (pid < 0)
        FailErrno("can't start %s", argv[0].c_str());
    if (pid == 0) {
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        if (getppid() != parent)
            _exit(127);
        const int null = open("/dev/null", O_RDWR | O_CLOEXEC);
        if (null >= 0) {
            dup2(null, STDIN_FILENO);
            dup2(null, STDOUT_FILENO);
            if (quiet)
                dup2(null, STDERR_FILENO);
        }
        execv(args[0], args.data());
        _exit(127);
    }
    ChildProcess child;
    child.pid_ = pid;
    return child;
}

bool ChildProcess::Ended(int *status) {
    if (pid_ < 0) {
        *status = 0;
        return true;
    }
    pid_t done;
    while ((done = waitpid(pid_, status, WNOHANG)) < 0 && errno == EINTR) {
    }
    if (done == 0)
        return false;
    pid_ = -1;
    return true;
}

int ChildProcess::Wait() {
    int status = 0;
    if (pid_ < 0)
        return status;
    while (waitpid(pid_, &status, 0) < 0) {
        if (errno != EINTR)
            FailErrno("can't wait for process %d", int(pid_));
    }
    pid_ = -1;
    return status;
}

void ChildProcess::Stop() {
    if (pid_ < 0)
        return;
    kill(pid_, SIGTERM);
    int status;
    for (int waited = 0; waited < kGraceMilliseconds; waited += 10) {
        if (Ended(&status))
            return;
        SleepMilliseconds(10);
    }
    kill(pid_, SIGKILL);
    Wait();
}

void RunProgram(const std::vector<std::string> &argv) {
    ChildProcess child = ChildProcess::Start(argv);
    const int status = child.Wait();
    if (WIFSIGNALED(status))
        Fail("%s died of signal %d", argv[0].c_str(), WTERMSIG(status));
    if (WEXITSTATUS(status) == 127)
        Fail("can't run %s", argv[0].c_str());
    if (WEXITSTATUS(status) != 0)
        Fail("%s failed with status %d", argv[0].c_str(), WEXITSTATUS(status));
}

std::string FindProgram(const std::string &program) {
    for (const char *dir : {"/usr/sbin", "/usr/bin", "/sbin", "/bin", "/usr/local/sbin", "/usr/local/bin"}) {
        const std::string path = std::string(dir) + "/" + program;
        if (access(path.c_str(), X_OK) == 0)
            return path;
    }
    return "";
}

}  // namespace norvo::testing::internal
