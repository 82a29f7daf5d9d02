// Running a helper program.
#pragma once
#include "platform_export.h"

QUIB_BEGIN_C

// Runs program (an absolute path; no shell, no search of PATH) with argv (null-terminated;
// argv[0] is the program's name for itself) and waits for it. The child gets only
// PATH=/usr/sbin:/usr/bin:/sbin:/bin in its environment (the CGI's environment is the
// request's), the caller's descriptors 0 to 2 and no other. Its exit status (0 to 255) when it
// exited; -1 with the slot set when it could not be started (errno's code: 0x0600 no such
// program, 0x0300 not executable, 0x0D00 bad arguments) or was ended by a signal (0x8100).
QUIB_API int VLIBCExec(const char *program, const char *const argv[]);

QUIB_END_C
