// Named critical sections between CGI processes: an exclusive flock on a lock file.
//
// flock belongs to the open file description, and the kernel closes every descriptor of a
// process that dies, however it dies: a holder killed with SIGKILL leaves the section without
// help, and there is no stale lock to detect or break. The lock file itself is never removed:
// removing it would let a waiter lock the old inode while a newcomer locks a new one.
// The descriptor is close-on-exec, so a program the holder starts does not keep the section;
// a child it forks shares it until that child exits or closes it.
#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <string>

#include "api_guard.h"
#include "locked_file.h"
#include "owned_file.h"
#include "quib_cgi.h"

using norvo::platform::FileDescriptor;
using norvo::platform::Guarded;

namespace {

long NowMs() {
    struct timespec now;
    clock_gettime(CLOCK_MONOTONIC, &now);
    return now.tv_sec * 1000L + now.tv_nsec / 1000000L;
}

// Polls with a growing pause (1 ms up to 50 ms): flock has no timeout of its own, and an alarm
// would disturb the caller's signals. 0, or the errno (EWOULDBLOCK on timeout).
int LockWithin(int fd, int timeoutMs) {
    const long deadline = NowMs() + timeoutMs;
    long pauseMs = 1;
    for (;;) {
        if (flock(fd, LOCK_EX | LOCK_NB) == 0) {
            return 0;
        }
        if (errno != EWOULDBLOCK && errno != EINTR) {
            return errno;
        }
        const long left = deadline - NowMs();
        if (left <= 0) {
            return EWOULDBLOCK;
        }
        const long pause = pauseMs < left ? pauseMs : left;
        const struct timespec wait = {pause / 1000, (pause % 1000) * 1000000L};
        nanosleep(&wait, nullptr);
        pauseMs = pauseMs * 2 > 50 ? 50 : pauseMs * 2;
    }
}

}  // namespace

int QuibCgiBeginCriticalSection(const char *name, int timeoutMs) {
    return Guarded(-1, [&] {
        if (timeoutMs < 0) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return -1;
        }
        FileDescriptor fd;
        if (const int code = norvo::platform::OpenOwnFile(name, O_RDWR | O_CREAT, &fd)) {
            QUIB_SET_ERR(code);
            return -1;
        }
        if (const int err = LockWithin(fd.Get(), timeoutMs)) {
            QUIB_SET_ERRNO(err);
            return -1;
        }
        return fd.Release();
    });
}

int QuibCgiEndCriticalSection(int handle) {
    // Closing the descriptor releases the lock; no unlock first, which could only fail. Linux
    // closes the descriptor even when close reports EINTR.
    if (handle < 0 || (close(handle) != 0 && errno == EBADF)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return 0;
}
