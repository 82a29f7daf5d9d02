// Unicode text helpers of the platform: case-insensitive comparison of UTF-8 strings.
#pragma once
#include "platform_export.h"

QUIB_BEGIN_C

// Compares s1 and s2 as UTF-8 text without regard to letter case (Unicode default full case
// folding, so "Straße" equals "STRASSE"), in code point order of the folded text. Negative,
// zero or positive, with the sign convention of strcmp. Never fails and never sets the error
// slot: a null string orders before every other one (two nulls are equal), and a byte that is
// not part of well-formed UTF-8 stands for itself (it equals only the same byte), so that the
// order stays total and consistent for any bytes. ASCII text is compared without ICU.
QUIB_API int VLIBCUnicodeUTF8StrCaseCmp(const char *s1, const char *s2);

QUIB_END_C

QUIB_BEGIN_C

// 1 when subject matches pattern as a whole, else 0 (also for a null pattern or subject): the
// wildcard matcher of name searches, behind the library's NvoLibStrLikeCompare (whose comment
// states the rules) and the file index's LIKE, so both always agree. Never sets the slot.
QUIB_API int VLIBCUnicodeUTF8LikeMatch(const char *pattern, const char *subject, int esc);

QUIB_END_C
