// What the wrappers share: the count, the record book, and the way to the real call.
#pragma once

namespace norvo::faults::seam {

// Counts a call made on an armed thread; true when it is the one to fail, with errno set to the
// armed error. A failing platform call also sets the platform error slot from it.
bool ShouldFail(const char *call);
bool ShouldFailPlatform(const char *call);
// The armed error, for wrappers that report it other than through errno.
int Error();
// The next definition of symbol after this library (the real one); aborts when there is none.
void *Next(const char *symbol);

// The record book: p was handed out by call / was released. Null is ignored.
void Track(const void *p, const char *call);
void Untrack(const void *p);
// A slot the real call may have refilled: before was released if it changed, after is new.
void Refilled(const void *before, const void *after, const char *call);

}  // namespace norvo::faults::seam

// The real definition of fn, looked up once.
#define SEAM_REAL(fn) \
    static const auto real = reinterpret_cast<decltype(&fn)>(::norvo::faults::seam::Next(#fn))
