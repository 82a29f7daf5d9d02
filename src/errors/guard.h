// The one exception guard of the library's exported entry points: no exception (in practice
// only bad_alloc) crosses the library's boundary, and the error slot says what happened.
#pragma once
#include <new>

#include "norvo/errors.h"

namespace norvo {

// Runs body and returns its result. An escaping exception becomes failResult with the slot
// set: 401 for bad_alloc (as ENOMEM maps), 400 for anything else (a bug, never a crash).
template <typename R, typename F>
R Guarded(R failResult, F &&body) noexcept {
    try {
        return body();
    } catch (const std::bad_alloc &) {
        NvoLibSetErr(NVO_ERR_SYSTEM);
    } catch (...) {
        NvoLibSetErr(NVO_ERR_GENERAL);
    }
    return failResult;
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
