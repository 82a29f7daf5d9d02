// The one exception guard of the library's exported entry points: no exception (in practice
// only bad_alloc) crosses the library's boundary, and the error slot says what happened.
#pragma once
#include <new>

#include "norvo/errors.h"

namespace norvo {

// Inside a catch handler: records the exception being handled in the slot, 401 for bad_alloc
// (as ENOMEM maps) and 400 for anything else (a bug, never a crash), and gives failResult.
// Entry points written as function-try-blocks end in `catch (...) { return Failed(x); }`.
template <typename R>
R Failed(R failResult) noexcept {
    try {
        throw;
    } catch (const std::bad_alloc &) {
        NvoLibSetErr(NVO_ERR_SYSTEM);
    } catch (...) {
        NvoLibSetErr(NVO_ERR_GENERAL);
    }
    return failResult;
}

// Runs body and returns its result; an escaping exception gives failResult (see Failed).
template <typename R, typename F>
R Guarded(R failResult, F &&body) noexcept {
    try {
        return body();
    } catch (...) {
        return Failed(failResult);
    }
}

// For entry points without a result: the slot alone tells the caller.
template <typename F>
void GuardedVoid(F &&body) noexcept {
    Guarded(0, [&] {
        body();
        return 0;
    });
}

}  // namespace norvo
