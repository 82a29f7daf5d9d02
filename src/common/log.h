// Failure logging. Every message format begins with "%s:%d " or "%s(%d)" or "%s (%d)": the
// module's source name and the line, filled in here so call sites pass only their own values.
// syslog carries a printf-format attribute, so a wrong argument is a compile error.
#pragma once
#include <syslog.h>

#include "vlibc_err.h"

// Logs at error level from module (e.g. "norvodir.cpp") with the caller's line.
#define NVO_LOG(module, fmt, ...) syslog(LOG_ERR, fmt, module, __LINE__, ##__VA_ARGS__)
// The same with a fixed line number, where the line is part of the message's contract.
#define NVO_LOG_AT(module, line, fmt, ...) syslog(LOG_ERR, fmt, module, line, ##__VA_ARGS__)
// Sets the platform error slot from library code, naming the module as the source.
#define NVO_SET_QUIB_ERR(module, code) VLIBCErrSetEx((code), module, __LINE__)
