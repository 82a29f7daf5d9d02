// The count of calls and the record book behind the wrappers.
#include <dlfcn.h>
#include <errno.h>
#include <stdio.h>
#include <stdlib.h>

#include <algorithm>
#include <map>
#include <mutex>

#include "faults.h"
#include "seam.h"
#include "vlibc_err.h"

namespace norvo::faults {
namespace {

// Per thread, so that only the thread running the operation moves the count.
thread_local long t_target = 0;  // 0: disarmed
thread_local long t_count = 0;
thread_local int t_error = 0;
thread_local const char *t_fired = nullptr;

std::mutex g_bookLock;
std::map<const void *, const char *> &Book() {
    static auto *book = new std::map<const void *, const char *>;  // outlives every static
    return *book;
}

}  // namespace

void Arm(long nth, int err) {
    t_target = nth;
    t_count = 0;
    t_error = err;
    t_fired = nullptr;
}

long Disarm() {
    t_target = 0;
    return t_count;
}

std::string Fired() {
    return t_fired == nullptr ? "" : t_fired;
}

std::vector<std::string> LiveRecords() {
    std::lock_guard<std::mutex> lock(g_bookLock);
    std::vector<std::string> live;
    for (const auto &[record, call] : Book()) {
        live.emplace_back(call);
    }
    std::sort(live.begin(), live.end());
    return live;
}

namespace seam {

bool ShouldFail(const char *call) {
    if (t_target == 0 || ++t_count != t_target) {
        return false;
    }
    t_fired = call;
    errno = t_error;
    return true;
}

bool ShouldFailPlatform(const char *call) {
    if (!ShouldFail(call)) {
        return false;
    }
    VLIBCErrSetEx(VLIBCErrFromErrno(t_error), "faults", 0);
    return true;
}

int Error() {
    return t_error;
}

void *Next(const char *symbol) {
    void *next = dlsym(RTLD_NEXT, symbol);
    if (next == nullptr) {
        fprintf(stderr, "faults: no definition of %s after the seam\n", symbol);
        abort();
    }
    return next;
}

void Track(const void *p, const char *call) {
    if (p != nullptr) {
        std::lock_guard<std::mutex> lock(g_bookLock);
        Book()[p] = call;
    }
}

void Untrack(const void *p) {
    std::lock_guard<std::mutex> lock(g_bookLock);
    Book().erase(p);
}

void Refilled(const void *before, const void *after, const char *call) {
    if (before != after) {
        Untrack(before);
        Track(after, call);
    }
}

}  // namespace seam
}  // namespace norvo::faults
