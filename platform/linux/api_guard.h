// What every exported entry point of the platform core shares: no exception crosses the C
// boundary, and errno reaches the error slot only through VLIBCErrFromErrno.
#pragma once
#include <new>
#include <utility>

#include "vlibc_err.h"

// Sets the error slot from a system errno, keeping the caller's place.
#define QUIB_SET_ERRNO(err) QUIB_SET_ERR(VLIBCErrFromErrno(err))

namespace norvo::platform {

// Runs body and returns its result. An escaping exception becomes failResult with the slot
// set: 0x2B00 for bad_alloc, 0x8000 for anything else (a bug, but never a crash of the CGI).
template <typename R, typename F>
R Guarded(R failResult, F &&body) noexcept {
    try {
        return body();
    } catch (const std::bad_alloc &) {
        QUIB_SET_ERR(QUIB_ERR_NO_MEMORY);
    } catch (...) {
        QUIB_SET_ERR(QUIB_ERR_INTERNAL);
    }
    return failResult;
}

// Runs a one-off release when the scope ends, unless dismissed.
template <typename F>
class ScopeExit {
public:
    explicit ScopeExit(F fn) : fn_(std::move(fn)) {}
    ~ScopeExit() {
        if (armed_) {
            fn_();
        }
    }
    ScopeExit(const ScopeExit &) = delete;
    ScopeExit &operator=(const ScopeExit &) = delete;
    void Dismiss() { armed_ = false; }

private:
    F fn_;
    bool armed_ = true;
};

}  // namespace norvo::platform
