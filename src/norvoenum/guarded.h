// The exported members of this module answer with their failure value rather than let an
// exception (in practice only bad_alloc) cross the library's boundary.
#pragma once

namespace norvo {

template <typename R, typename F>
R Guarded(R failResult, F &&body) noexcept {
    try {
        return body();
    } catch (...) {
        return failResult;
    }
}

}  // namespace norvo
