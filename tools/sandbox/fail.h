// How the sandbox reports a failure: it has no test framework to report to (it must not depend
// on one), so it says what went wrong on stderr and stops the process.
#pragma once

namespace norvo::testing::internal {

// Prints "norvo sandbox: <message>" and aborts.
[[noreturn]] void Fail(const char *format, ...) __attribute__((format(printf, 1, 2)));
// The same with ": <strerror(errno)>" appended.
[[noreturn]] void FailErrno(const char *format, ...) __attribute__((format(printf, 1, 2)));

}  // namespace norvo::testing::internal
