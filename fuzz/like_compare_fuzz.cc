// The wildcard matcher against its recursive definition, memoised so that hostile patterns
// (many stars) stay cheap for the reference too.
//
// Input: one byte choosing the escape character, then the pattern, a NUL, the subject. Both
// sides are decoded and folded the same way: a subject character equals a pattern literal
// when their default case foldings are equal, whatever byte sequence encoded it.
#include <stddef.h>
#include <stdint.h>

#include <string>
#include <vector>

#include <unicode/uchar.h>

#include "norvo/norvomisc.h"

namespace {

// A lead byte 0xC0..0xF4 takes 1, 2 or 3 trail bytes, unvalidated; any other byte is a
// character of its own; the end of the text cuts a sequence short.
std::vector<int32_t> Decode(const std::string &text) {
    std::vector<int32_t> out;
    for (size_t i = 0; i < text.size(); ++i) {
        const auto byte = static_cast<uint8_t>(text[i]);
        if (byte < 0xC0 || byte > 0xF4) {
            out.push_back(byte);
            continue;
        }
        const int trail = byte >= 0xF0 ? 3 : byte >= 0xE0 ? 2 : 1;
        int32_t c = byte & ((1 << (6 - trail)) - 1);
        for (int k = 0; k < trail && i + 1 < text.size(); ++k) {
            c = (c << 6) | (static_cast<uint8_t>(text[++i]) & 0x3F);
        }
        out.push_back(c);
    }
    return out;
}

class Reference {
public:
    Reference(std::vector<int32_t> p, std::vector<int32_t> s, int esc)
        : p_(std::move(p)), s_(std::move(s)), esc_(esc), memo_((p_.size() + 1) * (s_.size() + 1), -1) {}

    int Match() { return From(0, 0); }

private:
    // The pattern from pi against the subject from si; each pair is worked out once.
    int From(size_t pi, size_t si) {
        int &known = memo_[pi * (s_.size() + 1) + si];
        if (known < 0) {
            known = Walk(pi, si);
        }
        return known;
    }

    int Walk(size_t pi, size_t si) {
        bool escaped = false;
        for (;;) {
            if (pi == p_.size()) {
                return si == s_.size() ? 1 : 0;
            }
            const int32_t c = p_[pi++];
            if (!escaped && c == '*') {
                // Further stars and question marks belong to this one; each '?' needs a character.
                for (; pi < p_.size() && (p_[pi] == '*' || p_[pi] == '?'); ++pi) {
                    if (p_[pi] == '?') {
                        if (si == s_.size()) {
                            return 0;
                        }
                        ++si;
                    }
                }
                if (pi == p_.size()) {
                    return 1;
                }
                // The rest is tried at every character of the subject, never at its end.
                for (; si < s_.size(); ++si) {
                    if (From(pi, si) == 1) {
                        return 1;
                    }
                }
                return 0;
            }
            if (!escaped && c == '?') {
                if (si == s_.size()) {
                    return 0;
                }
                ++si;
            } else if (!escaped && c == esc_) {
                escaped = true;  // an escape at the very end ends the pattern
            } else {
                if (si == s_.size() || Fold(c) != Fold(s_[si])) {
                    return 0;
                }
                ++si;
                escaped = false;
            }
        }
    }

    static int32_t Fold(int32_t c) { return u_foldCase(c, U_FOLD_CASE_DEFAULT); }

    std::vector<int32_t> p_;
    std::vector<int32_t> s_;
    int esc_;
    std::vector<int> memo_;
};

// Escape characters worth telling apart: the usual one, the wildcards themselves, a letter,
// characters above ASCII (one with a case folding), and none.
const int kEscapes[] = {'\\', '\\', '\\', '\\', '*', '?', 'a', 'K', 0xE9, 0x212A, 0x17F, 0, -1};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size == 0) {
        return 0;
    }
    const int esc = kEscapes[data[0] % (sizeof(kEscapes) / sizeof(kEscapes[0]))];
    const std::string rest(reinterpret_cast<const char *>(data) + 1, size - 1);
    const size_t nul = rest.find('\0');
    const std::string pattern = rest.substr(0, nul);
    // The subject ends at its own NUL, as the C strings the matcher takes do.
    std::string subject = nul == std::string::npos ? std::string() : rest.substr(nul + 1);
    subject = subject.substr(0, subject.find('\0'));

    const int got = NvoLibStrLikeCompare(pattern.c_str(), subject.c_str(), esc);
    const int want = Reference(Decode(pattern), Decode(subject), esc).Match();
    if (got != want) {
        __builtin_trap();
    }
    return 0;
}
