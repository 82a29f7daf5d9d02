#include "norvo/errors.h"

namespace {
// One per process, no lock: a CGI process is single-threaded.
int g_errorSlot = 0;
}  // namespace

int NvoLibSetErr(int code) {
    g_errorSlot = code;
    return code;
}

int NvoLibGetErr(void) {
    return g_errorSlot;
}
