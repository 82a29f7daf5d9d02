// VLIBCExec over posix_spawn: no shell ever parses an argument.
#include <errno.h>
#include <spawn.h>
#include <sys/wait.h>

#include "api_guard.h"
#include "fs_path.h"
#include "vlibc_exec.h"

int VLIBCExec(const char *program, const char *const argv[]) {
    return norvo::platform::Guarded(-1, [&] {
        if (const int err = norvo::platform::CheckPathArgument(program)) {
            return NORVO_FAIL_ERRNO(err);
        }
        if (program[0] != '/' || argv == nullptr || argv[0] == nullptr) {
            return NORVO_FAIL_ERRNO(EINVAL);
        }
        char path[] = "PATH=/usr/sbin:/usr/bin:/sbin:/bin";
        char *const environment[] = {path, nullptr};
        posix_spawn_file_actions_t actions;
        if (const int err = posix_spawn_file_actions_init(&actions)) {
            return NORVO_FAIL_ERRNO(err);
        }
        norvo::platform::ScopeExit destroy([&] { posix_spawn_file_actions_destroy(&actions); });
        // Descriptors a caller left inheritable (a database, a lock) stay with the caller.
        if (const int err = posix_spawn_file_actions_addclosefrom_np(&actions, 3)) {
            return NORVO_FAIL_ERRNO(err);
        }
        pid_t child = 0;
        // posix_spawn takes char *const[]; it does not write through them.
        if (const int err = posix_spawn(&child, program, &actions, nullptr, const_cast<char *const *>(argv),
                                        environment)) {
            return NORVO_FAIL_ERRNO(err);
        }
        int status = 0;
        while (waitpid(child, &status, 0) < 0) {
            if (errno != EINTR) {
                return NORVO_FAIL_ERRNO(errno);
            }
        }
        return WIFEXITED(status) ? WEXITSTATUS(status) : NORVO_FAIL_ERRNO(0);
    });
}
