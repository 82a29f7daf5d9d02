// norvo-sandbox: runs a command inside a throwaway appliance described by an appliance file.
//
//   norvo-sandbox [--user=NAME] [--log=FILE | --no-log] APPLIANCE-FILE -- COMMAND [ARG...]
//
// The command runs in the appliance's mount namespace and in a PID namespace of its own, so
// when it ends every process it left behind ends too and the appliance vanishes. The exit
// status is the command's (128 + signal when it was killed); 125 means the sandbox itself
// could not start (usage or appliance-file error), 126 and 127 that the command could not run.
#include <fcntl.h>
#include <sched.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "appliance.h"
#include "appliance_file.h"
#include "fs_util.h"
#include "identity.h"

namespace {

constexpr int kSandboxFailed = 125;
constexpr int kCannotExecute = 126;
constexpr int kNotFound = 127;

struct Options {
    std::string user;
    std::string log = "-";  // "-": stderr, "": discard
    std::string applianceFile;
    std::vector<std::string> command;
};

void Usage() {
    fprintf(
        stderr,
        "usage: norvo-sandbox [--user=NAME] [--log=FILE | --no-log] APPLIANCE-FILE -- COMMAND [ARG...]\n");
}

bool ParseOptions(int argc, char **argv, Options *options) {
    int at = 1;
    for (; at < argc && strncmp(argv[at], "--", 2) == 0 && strcmp(argv[at], "--") != 0; ++at) {
        const std::string arg = argv[at];
        if (arg.rfind("--user=", 0) == 0)
            options->user = arg.substr(7);
        else if (arg.rfind("--log=", 0) == 0)
            options->log = arg.substr(6);
        else if (arg == "--no-log")
            options->log.clear();
        else
            return false;
    }
    if (at + 2 >= argc || strcmp(argv[at + 1], "--") != 0)
        return false;
    options->applianceFile = argv[at];
    options->command.assign(argv + at + 2, argv + argc);
    return true;
}

const char *SeverityName(int priority) {
    static const char *const kNames[] = {"emerg",   "alert",  "crit", "err",
                                         "warning", "notice", "info", "debug"};
    return priority >= 0 && priority < 8 ? kNames[priority] : "raw";
}

// The status a shell would report for a waitpid status.
int ShellStatus(int status) {
    return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

// The command's process. Never returns.
[[noreturn]] void ExecCommand(const Options &options) {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    signal(SIGINT, SIG_DFL);
    signal(SIGQUIT, SIG_DFL);
    if (!options.user.empty())
        norvo::testing::internal::BecomeUser(options.user);
    std::vector<char *> args;
    for (const auto &arg : options.command)
        args.push_back(const_cast<char *>(arg.c_str()));
    args.push_back(nullptr);
    execvp(args[0], args.data());
    const int error = errno;
    fprintf(stderr, "norvo-sandbox: can't run %s: %s\n", args[0], strerror(error));
    _exit(error == ENOENT ? kNotFound : kCannotExecute);
}

// The first process of the PID namespace: reaps whatever the command leaves and exits with the
// command's status, which ends every process still in the namespace.
[[noreturn]] void RunInit(const Options &options) {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    const pid_t command = fork();
    if (command < 0) {
        perror("norvo-sandbox: fork");
        _exit(kSandboxFailed);
    }
    if (command == 0)
        ExecCommand(options);
    for (;;) {
        int status = 0;
        const pid_t done = wait(&status);
        if (done < 0 && errno == EINTR)
            continue;
        if (done < 0)
            _exit(kSandboxFailed);
        if (done == command)
            _exit(ShellStatus(status));
    }
}

int RunCommand(const Options &options) {
    if (unshare(CLONE_NEWPID) != 0) {
        perror("norvo-sandbox: can't create a PID namespace");
        return kSandboxFailed;
    }
    fflush(nullptr);
    const pid_t init = fork();
    if (init < 0) {
        perror("norvo-sandbox: fork");
        return kSandboxFailed;
    }
    if (init == 0)
        RunInit(options);
    // Like system(): the terminal's interrupt is for the command, which decides.
    signal(SIGINT, SIG_IGN);
    signal(SIGQUIT, SIG_IGN);
    int status = 0;
    while (waitpid(init, &status, 0) < 0) {
        if (errno != EINTR) {
            perror("norvo-sandbox: waitpid");
            return kSandboxFailed;
        }
    }
    return ShellStatus(status);
}

}  // namespace

int main(int argc, char **argv) {
    Options options;
    if (!ParseOptions(argc, argv, &options)) {
        Usage();
        return kSandboxFailed;
    }
    std::string text;
    if (!norvo::testing::internal::ReadWholeFile(options.applianceFile, &text)) {
        fprintf(stderr, "norvo-sandbox: can't read %s: %s\n", options.applianceFile.c_str(), strerror(errno));
        return kSandboxFailed;
    }
    norvo::testing::ApplianceFile file;
    std::string error;
    if (!norvo::testing::ParseApplianceFile(text, options.applianceFile, &file, &error)) {
        fprintf(stderr, "norvo-sandbox: %s\n", error.c_str());
        return kSandboxFailed;
    }
    // Opened on the host, before the namespace: the one thing the run leaves behind on request.
    FILE *log = nullptr;
    if (options.log == "-") {
        log = stderr;
    } else if (!options.log.empty()) {
        log = fopen(options.log.c_str(), "ae");
        if (log == nullptr) {
            fprintf(stderr, "norvo-sandbox: can't open %s: %s\n", options.log.c_str(), strerror(errno));
            return kSandboxFailed;
        }
    }

    int status;
    {
        norvo::testing::Appliance appliance;
        norvo::testing::BuildAppliance(appliance, file);
        appliance.ForwardLogs([log](const norvo::testing::LogLine &line) {
            if (log == nullptr)
                return;
            fprintf(log, "syslog.%s: %s\n", SeverityName(line.priority), line.text.c_str());
            fflush(log);
        });
        status = RunCommand(options);
    }
    if (log != nullptr && log != stderr)
        fclose(log);
    return status;
}
