#include "fail.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace norvo::testing::internal {

namespace {

[[noreturn]] __attribute__((format(printf, 1, 0))) void Report(const char *format, va_list args,
                                                               const char *reason) {
    char message[2048];
    vsnprintf(message, sizeof message, format, args);
    if (reason != nullptr)
        fprintf(stderr, "norvo sandbox: %s: %s\n", message, reason);
    else
        fprintf(stderr, "norvo sandbox: %s\n", message);
    fflush(stderr);
    abort();
}

}  // namespace

void Fail(const char *format, ...) {
    va_list args;
    va_start(args, format);
    Report(format, args, nullptr);
}

void FailErrno(const char *format, ...) {
    const char *reason = strerror(errno);  // before anything else can change errno
    va_list args;
    va_start(args, format);
    Report(format, args, reason);
}

}  // namespace norvo::testing::internal
