// The wildcard matcher of name searches, here in the platform so that the library's in-memory
// test and the file index's SQL LIKE are one implementation. It walks both texts in place, one
// decoded code point at a time, and backtracks only to the last star: no allocation, no
// recursion, and at most (pattern length) x (subject length) steps, since it runs over millions
// of names per search and a hostile pattern must not stall a request.
//
// Why remembering only the last star is enough: after a star, the pattern up to the next star
// matches a fixed number of characters, and whether the next star's block can still succeed only
// gets worse the later it starts. So the first place where that piece matches is the best one,
// and an earlier star never needs to move again once a later one is reached.
#include <stdint.h>

#include <unicode/uchar.h>
#include <unicode/utf8.h>

#include "like_decode.h"
#include "vlibc_unicode.h"

namespace {

constexpr UChar32 kMatchAll = '*';
constexpr UChar32 kMatchOne = '?';

// u_foldCase(c, U_FOLD_CASE_DEFAULT) for ASCII: only the capital letters change.
struct AsciiFold {
    uint8_t to[128];
    constexpr AsciiFold() : to() {
        for (int c = 0; c < 128; ++c) {
            to[c] = static_cast<uint8_t>(c >= 'A' && c <= 'Z' ? c + ('a' - 'A') : c);
        }
    }
};
constexpr AsciiFold kAsciiFold;

inline UChar32 Fold(UChar32 c) {
    return c < 128 ? kAsciiFold.to[c] : u_foldCase(c, U_FOLD_CASE_DEFAULT);
}

inline const uint8_t *Decode(const uint8_t *text, UChar32 *c) {
    return norvo::platform::DecodeLikeChar(text, c);
}

inline const uint8_t *Skip(const uint8_t *text) {
    UChar32 ignored;
    return Decode(text, &ignored);
}

// A pattern element: a star, a one-character wildcard, a literal (folded), or the end of the
// pattern. An escape character with nothing after it ends the pattern; it is an element of its
// own (kEscapedEnd) because right after a star it still has to be tried against the subject.
enum class Kind { kEnd, kAll, kOne, kLiteral, kEscapedEnd };

struct Element {
    Kind kind;
    UChar32 folded;
    const uint8_t *next;
};

// Star and question mark are recognised before the escape character, so an escape character
// of '*' or '?' acts as the wildcard (intended: that is the order in which they are tested).
inline Element Read(const uint8_t *pattern, UChar32 esc) {
    if (*pattern == 0) {
        return {Kind::kEnd, 0, pattern};
    }
    UChar32 c;
    const uint8_t *next = Decode(pattern, &c);
    if (c == kMatchAll) {
        return {Kind::kAll, 0, next};
    }
    if (c == kMatchOne) {
        return {Kind::kOne, 0, next};
    }
    if (c == esc) {
        if (*next == 0) {
            return {Kind::kEscapedEnd, 0, next};
        }
        next = Decode(next, &c);
    }
    return {Kind::kLiteral, Fold(c), next};
}

// Whether the subject character at s folds to literal (itself folded); *next is set past it.
// Both sides are decoded and folded by the same rule, so an overlong sequence that decodes to an
// ASCII letter folds as that letter does in the pattern. Above ASCII only U+017F and U+212A fold
// into ASCII (case folding is stable across Unicode versions; a test checks the linked ICU), so
// most comparisons of names with an ASCII pattern need no call.
inline bool FoldsTo(const uint8_t *s, UChar32 literal, const uint8_t **next) {
    if (*s < 0x80) {
        *next = s + 1;
        return kAsciiFold.to[*s] == literal;
    }
    UChar32 c;
    *next = Decode(s, &c);
    if (c == literal) {
        return true;  // folding is idempotent
    }
    if (literal < 0x80 && c >= 0x80 && c != 0x17F && c != 0x212A) {
        return false;
    }
    return Fold(c) == literal;
}

// Past the first character from s on that folds to literal; null when the subject ends first.
inline const uint8_t *SeekPast(const uint8_t *s, UChar32 literal) {
    while (*s != 0) {
        const uint8_t *next;
        if (FoldsTo(s, literal, &next)) {
            return next;
        }
        s = next;
    }
    return nullptr;
}

int Match(const uint8_t *pattern, const uint8_t *subject, UChar32 esc) {
    const uint8_t *p = pattern;
    const uint8_t *s = subject;
    // The last star: the literal that follows its block, the pattern after that literal, and
    // the subject after the place where the literal was last found. Nothing before the star is
    // ever tried again.
    bool star = false;
    UChar32 starLiteral = 0;
    const uint8_t *starPattern = nullptr;
    const uint8_t *starResume = nullptr;
    for (;;) {
        const Element e = Read(p, esc);
        bool advanced = false;
        switch (e.kind) {
            case Kind::kEnd:
            case Kind::kEscapedEnd:
                if (*s == 0) {
                    return 1;
                }
                break;
            case Kind::kAll: {
                // Further stars and question marks are taken at once, each '?' eating a character.
                p = e.next;
                for (;;) {
                    if (*p == 0) {
                        return 1;
                    }
                    UChar32 c;
                    const uint8_t *next = Decode(p, &c);
                    if (c != kMatchAll && c != kMatchOne) {
                        break;
                    }
                    if (c == kMatchOne) {
                        if (*s == 0) {
                            return 0;
                        }
                        s = Skip(s);
                    }
                    p = next;
                }
                // The rest is tried at each character of the subject, never at its end; so an
                // escape character that ends the pattern here can never match.
                const Element first = Read(p, esc);
                starResume = first.kind == Kind::kLiteral ? SeekPast(s, first.folded) : nullptr;
                if (starResume == nullptr) {
                    return 0;
                }
                star = true;
                starLiteral = first.folded;
                starPattern = first.next;
                s = starResume;
                p = starPattern;
                advanced = true;
                break;
            }
            case Kind::kOne:
                if (*s != 0) {
                    s = Skip(s);
                    p = e.next;
                    advanced = true;
                }
                break;
            case Kind::kLiteral:
                if (*s != 0) {
                    const uint8_t *next;
                    if (FoldsTo(s, e.folded, &next)) {
                        s = next;
                        p = e.next;
                        advanced = true;
                    }
                }
                break;
        }
        if (advanced) {
            continue;
        }
        // Try the piece after the star one character further on.
        if (!star || (starResume = SeekPast(starResume, starLiteral)) == nullptr) {
            return 0;
        }
        s = starResume;
        p = starPattern;
    }
}

}  // namespace

int VLIBCUnicodeUTF8LikeMatch(const char *pattern, const char *subject, int esc) {
    if (pattern == nullptr || subject == nullptr) {
        return 0;
    }
    return Match(reinterpret_cast<const uint8_t *>(pattern), reinterpret_cast<const uint8_t *>(subject), esc);
}
