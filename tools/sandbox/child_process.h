// Programs the appliance runs: mkfs.vfat once, FUSE servers for its whole life.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace norvo::testing::internal {

// An owned child process: stopped (SIGTERM, then SIGKILL after a grace period) and reaped when
// its owner goes. The child also receives SIGKILL if this process dies first, so a crashed test
// leaves no server behind to keep its namespace alive.
class ChildProcess {
public:
    ChildProcess() = default;
    ChildProcess(ChildProcess &&other) noexcept;
    ChildProcess &operator=(ChildProcess &&other) noexcept;
    ChildProcess(const ChildProcess &) = delete;
    ChildProcess &operator=(const ChildProcess &) = delete;
    ~ChildProcess() { Stop(); }

    // Starts argv[0] (an absolute path) with argv, stdin and stdout on /dev/null, and stderr
    // too when quiet. Fails (aborts) when it can't fork; an exec failure shows as status 127.
    static ChildProcess Start(const std::vector<std::string> &argv, bool quiet = false);

    pid_t pid() const { return pid_; }
    // True and *status (a waitpid status) when the child has ended; false while it runs.
    [[nodiscard]] bool Ended(int *status);
    // Waits for the child to end and returns its waitpid status.
    int Wait();
    // Ends the child and reaps it; nothing when there is none.
    void Stop();

private:
    pid_t pid_ = -1;
};

// Runs argv to completion; fails (aborts) unless it exits with status 0.
void RunProgram(const std::vector<std::string> &argv);

// Finds program on the usual system directories; "" when absent.
std::string FindProgram(const std::string &program);

}  // namespace norvo::testing::internal
