// Helpers shared by the platform tests.
#pragma once

#include <errno.h>

#include <fstream>
#include <iterator>
#include <ostream>
#include <string>

#include "vlibc_err.h"

namespace norvo::testing {

// What a call left behind: its result, the error slot and errno; kAny is not compared (the slot
// is not cleared on success, nor promised to stay untouched then).
constexpr int kAny = -1;
struct Outcome { long rc; int slot = kAny; int err = kAny; };
inline bool operator==(const Outcome &a, const Outcome &b) {
    const auto same = [](int x, int y) { return x == kAny || y == kAny || x == y; };
    return a.rc == b.rc && same(a.slot, b.slot) && same(a.err, b.err);
}
inline std::ostream &operator<<(std::ostream &out, const Outcome &o) {
    return out << "{rc " << o.rc << ", slot 0x" << std::hex << o.slot << std::dec << ", errno " << o.err << "}";
}

inline Outcome Failed(int slot, int err = kAny) { return {-1, slot, err}; }

// Runs call with errno and the error slot cleared first, so neither can be left from before.
template <typename F>
Outcome OutcomeOf(F &&call) {
    errno = 0;
    VLIBCErrSetEx(QUIB_ERR_NONE, "", 0);
    const long rc = static_cast<long>(call());
    return {rc, VLIBCErrGet(), errno};
}

// The whole of a file, byte for byte; "" when it can't be read.
inline std::string ReadFile(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), {});
}

}  // namespace norvo::testing

// The Outcome of one call expression: EXPECT_EQ(OUTCOME(f(x)), Failed(QUIB_ERR_...)).
#define OUTCOME(call) norvo::testing::OutcomeOf([&] { return call; })
