// VLIBCUnicodeUTF8StrCaseCmp. Listings sort tens of thousands of names with it, so the common
// case (both names ASCII so far) is a byte loop; ICU is asked only for the rest of two names
// from their first non-ASCII byte on. That is exact: ASCII letters fold to single ASCII letters
// and folding works code point by code point, so a prefix that folds equal can be dropped.
#include <string.h>
#include <unicode/uchar.h>
#include <unicode/ustring.h>
#include <unicode/utf8.h>

#include <vector>

#include "vlibc_unicode.h"

namespace {

// Names are at most 255 bytes; longer text goes to the heap.
constexpr size_t kStackUnits = 512;

int AsciiLower(unsigned char c) {
    return (c >= 'A' && c <= 'Z') ? c + ('a' - 'A') : c;
}

// UTF-8 to UTF-16 where an ill-formed byte becomes the lone surrogate U+DC00 + byte (well-formed
// UTF-8 never encodes surrogates, and lone surrogates fold to themselves), so two different
// byte strings never become the same text. out holds at least length units.
int32_t ToUtf16Escaped(const char *text, int32_t length, UChar *out) {
    const auto *bytes = reinterpret_cast<const uint8_t *>(text);
    int32_t units = 0;
    int32_t at = 0;
    while (at < length) {
        const int32_t start = at;
        UChar32 c = 0;
        U8_NEXT(bytes, at, length, c);
        if (c < 0) {
            at = start + 1;
            out[units++] = static_cast<UChar>(0xDC00 + bytes[start]);
        } else {
            U16_APPEND_UNSAFE(out, units, c);
        }
    }
    return units;
}

int IcuCaseCompare(const char *a, const char *b) {
    const size_t la = strlen(a);
    const size_t lb = strlen(b);
    UChar stackA[kStackUnits];
    UChar stackB[kStackUnits];
    std::vector<UChar> heapA;
    std::vector<UChar> heapB;
    UChar *ua = stackA;
    UChar *ub = stackB;
    if (la > kStackUnits) {
        heapA.resize(la);
        ua = heapA.data();
    }
    if (lb > kStackUnits) {
        heapB.resize(lb);
        ub = heapB.data();
    }
    // Text of 2 GiB or more is no name; its rest is compared as bytes.
    if (la > INT32_MAX || lb > INT32_MAX) {
        return strcmp(a, b);
    }
    const int32_t na = ToUtf16Escaped(a, static_cast<int32_t>(la), ua);
    const int32_t nb = ToUtf16Escaped(b, static_cast<int32_t>(lb), ub);
    UErrorCode status = U_ZERO_ERROR;
    const int32_t result =
        u_strCaseCompare(ua, na, ub, nb, U_FOLD_CASE_DEFAULT | U_COMPARE_CODE_POINT_ORDER, &status);
    if (U_FAILURE(status)) {
        return strcmp(a, b);
    }
    return result;
}

}  // namespace

int VLIBCUnicodeUTF8StrCaseCmp(const char *s1, const char *s2) {
    if (s1 == nullptr || s2 == nullptr) {
        return (s1 != nullptr) - (s2 != nullptr);
    }
    const auto *a = reinterpret_cast<const unsigned char *>(s1);
    const auto *b = reinterpret_cast<const unsigned char *>(s2);
    while (*a < 0x80 && *b < 0x80) {
        const int ca = AsciiLower(*a);
        const int cb = AsciiLower(*b);
        if (ca != cb) {
            return ca - cb;
        }
        if (ca == 0) {
            return 0;
        }
        ++a;
        ++b;
    }
    // Only a name over 512 bytes needs memory; should it run out, the rest compares as bytes.
    try {
        return IcuCaseCompare(reinterpret_cast<const char *>(a), reinterpret_cast<const char *>(b));
    } catch (...) {
        return strcmp(reinterpret_cast<const char *>(a), reinterpret_cast<const char *>(b));
    }
}
