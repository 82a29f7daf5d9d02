// The fault seam: a test-only library linked ahead of libnorvoplatform (and libc) that counts
// the platform's entry points and the system calls that take resources, and makes the Nth one
// fail as a real failure would. Production code has no hooks; each wrapper forwards to the real
// call with dlsym(RTLD_NEXT, ...). Only calls made on the thread that armed the seam count, so
// the syslog capture thread and other threads never shift N.
//
// It also keeps the platform records, cursors, string lists, passes and share objects handed
// out through the entry points it wraps, so a test can see that none outlives an operation.
#pragma once
#include <string>
#include <vector>

namespace norvo::faults {

// From now on, on the calling thread, the nth counted call (1 is the next one) fails with err:
// it returns its failure value with errno = err and the platform error slot set from err.
void Arm(long nth, int err);
// Stops counting on the calling thread; returns how many calls were counted since Arm.
long Disarm();
// The call that was made to fail since the last Arm ("" when none was: the armed call was
// never reached), e.g. "QUIBShareGet" or "openat".
std::string Fired();

// One line per live record the seam saw handed out and not yet released ("QUIBShareGet",
// "QUIBDirPassBegin", ...: the call that made it), sorted.
std::vector<std::string> LiveRecords();

}  // namespace norvo::faults
