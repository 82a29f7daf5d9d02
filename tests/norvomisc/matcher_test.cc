// The wildcard matcher against a direct, slow transcription of its recursive definition.
#include <stdint.h>

#include <iterator>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <unicode/uchar.h>

#include "norvo/norvomisc.h"

namespace {

// ICU's own default case folding, the reference the matcher must agree with.
UChar32 IcuFold(UChar32 c) {
    return u_foldCase(c, U_FOLD_CASE_DEFAULT);
}

// Decoding as defined: a lead byte 0xC0..0xF4 takes 1, 2 or 3 trail bytes, unvalidated, keeping
// its low 6, 5 or 4 bits; any other byte is a character of its own. The text's end cuts a
// sequence short.
std::vector<int32_t> Decode(const std::string &text) {
    std::vector<int32_t> out;
    for (size_t i = 0; i < text.size(); ++i) {
        const auto byte = static_cast<uint8_t>(text[i]);
        if (byte < 0xC0 || byte > 0xF4) {
            out.push_back(byte);
            continue;
        }
        const int trail = byte >= 0xF0 ? 3 : byte >= 0xE0 ? 2 : 1;
        int32_t c = byte & ((1 << (7 - trail)) - 1);
        for (int k = 0; k < trail && i + 1 < text.size(); ++k) {
            c = (c << 6) | (static_cast<uint8_t>(text[++i]) & 0x3F);
        }
        out.push_back(c);
    }
    return out;
}

// The recursion as described, exponential in the worst case.
int Reference(const std::vector<int32_t> &p, size_t pi, const std::vector<int32_t> &s, size_t si, int esc) {
    bool escaped = false;
    for (;;) {
        if (pi == p.size()) {
            return si == s.size() ? 1 : 0;
        }
        const int32_t c = p[pi++];
        if (!escaped && c == '*') {
            for (; pi < p.size() && (p[pi] == '*' || p[pi] == '?'); ++pi) {
                if (p[pi] == '?') {
                    if (si == s.size()) {
                        return 0;
                    }
                    ++si;
                }
            }
            if (pi == p.size()) {
                return 1;
            }
            if (si == s.size()) {
                return 0;
            }
            for (; si < s.size(); ++si) {
                if (Reference(p, pi, s, si, esc) == 1) {
                    return 1;
                }
            }
            return 0;
        }
        if (!escaped && c == '?') {
            if (si == s.size()) {
                return 0;
            }
            ++si;
        } else if (!escaped && c == esc) {
            escaped = true;
        } else {
            if (si == s.size() || IcuFold(c) != IcuFold(s[si])) {
                return 0;
            }
            ++si;
            escaped = false;
        }
    }
}

// Pieces texts are built from: ASCII in both cases, characters whose folding matters (Kelvin
// sign and k, capital sharp s and ß, the three sigmas), invalid bytes (a stray trail byte, 0xFF,
// a lead byte that eats what follows or is cut short by the end), an overlong '*' and overlong
// letters, a code point above U+10FFFF, and four-byte characters.
const std::vector<std::string> kLetters = {
    "a", "A", "b", "B", "k", "s", ".", "\xC3\xA9", "\xC3\x89", "\xE2\x84\xAA", "\xE1\xBA\x9E", "\xC3\x9F",
    "\xCE\xA3", "\xCF\x83", "\xCF\x82", "\x80", "\xFF", "\xC3", "\xE2\x84", "\xC0\xAA", "\xC1\x81", "\xC1\xA1", "\xF4\x90\x80\x80",
    "\xF0\x9F\x98\x80", "%"};
const std::vector<std::string> kWild = {"*", "?", "\\", "**", "*?", "?*"};

// A pattern made from the subject's own pieces, so that many cases match: some kept, some
// replaced by '?', a run by '*', escaped, or swapped for any letter or wildcard.
std::string PatternFor(const std::vector<std::string> &pieces, std::mt19937 &rng) {
    const auto any = [&rng](const std::vector<std::string> &list) { return list[rng() % list.size()]; };
    std::string out;
    for (size_t i = 0; i <= pieces.size(); ++i) {
        const std::string piece = i < pieces.size() ? pieces[i] : "";
        switch (rng() % 9) {
        case 0: out += '?'; break;
        case 1: out += '*'; i += rng() % 3; break;
        case 2: out += '\\' + piece; break;
        case 3: out += any(kLetters); break;
        case 4: out += any(kWild); break;
        default: out += piece;
        }
    }
    return out;
}

TEST(Matcher, EqualsTheRecursiveDefinitionOnGeneratedTexts) {
    const int escapes[] = {'\\', '\\', '\\', '*', '?', 'a', 0xE9, 0x212A, -1};
    std::mt19937 rng(20240611);
    int matched = 0;
    const int kCases = 60000;
    for (int i = 0; i < kCases; ++i) {
        std::vector<std::string> pieces(rng() % 9);
        std::string subject;
        for (std::string &piece : pieces) {
            piece = rng() % 6 == 0 ? kWild[rng() % kWild.size()] : kLetters[rng() % kLetters.size()];
            subject += piece;
        }
        const std::string pattern = PatternFor(pieces, rng);
        const int esc = escapes[rng() % std::size(escapes)];
        const int expected = Reference(Decode(pattern), 0, Decode(subject), 0, esc);
        ASSERT_EQ(NvoLibStrLikeCompare(pattern.c_str(), subject.c_str(), esc), expected)
            << "pattern \"" << pattern << "\" subject \"" << subject << "\" esc " << esc;
        matched += expected;
    }
    // Both outcomes must be well represented for the comparison to mean anything.
    EXPECT_GT(matched, kCases / 5);
    EXPECT_LT(matched, kCases * 4 / 5);
}

// What the matcher's shortcuts rely on: above ASCII only U+017F and U+212A fold into it, and
// folding a folded character changes nothing; and its table folds ASCII as ICU does, however
// the subject's character is written.
TEST(Matcher, FoldsExactlyAsIcu) {
    for (UChar32 c = 0; c <= 0x10FFFF; ++c) {
        ASSERT_EQ(IcuFold(c) < 0x80, c < 0x80 || c == 0x17F || c == 0x212A) << std::hex << c;
        ASSERT_EQ(IcuFold(IcuFold(c)), IcuFold(c)) << std::hex << c;
    }
    for (int p = 1; p < 128; ++p) {
        for (int s = 1; s < 128; ++s) {
            if (p == '*' || p == '?') {
                continue;
            }
            const char pattern[] = {static_cast<char>(p), '\0'};
            const char subject[] = {static_cast<char>(s), '\0'};
            ASSERT_EQ(NvoLibStrLikeCompare(pattern, subject, -1),
                      IcuFold(p) == IcuFold(s) ? 1 : 0)
                << p << " " << s;
            // The same character written as an overlong pair folds the same, on either side.
            const char overlong[] = {static_cast<char>(0xC0 | (s >> 6)), static_cast<char>(0x80 | (s & 0x3F)), '\0'};
            ASSERT_EQ(NvoLibStrLikeCompare(pattern, overlong, -1), IcuFold(p) == IcuFold(s) ? 1 : 0) << p << " " << s;
        }
    }
}

TEST(Matcher, DescribedCases) {
    struct Case {
        const char *pattern;
        const char *subject;
        int esc;
        int result;
    } cases[] = {
        {"*.JPG", "a.jpg", '\\', 1}, {"a?c", "abbc", '\\', 0}, {"a?c", "abc", '\\', 1}, {"100\\%", "100%", '\\', 1},
        {"100\\%", "1000", '\\', 0}, {"\\*", "*", '\\', 1}, {"\\*", "a", '\\', 0}, {"*", "", '\\', 1},
        {"", "", '\\', 1}, {"", "a", '\\', 0},
        {"a\\", "a", '\\', 1},          // an escape with nothing after it ends the pattern
        {"*\\", "a", '\\', 0},          // ... but after a star the rest is never tried at the end
        {"*\\", "", '\\', 0},
        {"*??", "a", '\\', 0},          // question marks after a star need their characters
        {"*??", "ab", '\\', 1},
        {"\\\\*", "\\abc", '\\', 1},    // an escaped escape character, then a star
        {"a*", "a", '*', 1},            // the star is recognised before the escape character
        {"*report*", "Q3 REPORT final.pdf", '\\', 1},
        {"\xCF\x82", "\xCE\xA3", '\\', 1},              // final sigma and capital sigma fold alike
        {"k", "\xE2\x84\xAA", '\\', 1},                 // Kelvin sign folds to k
        {"\xC3\xA9t\xC3\xA9", "\xC3\x89T\xC3\x89", '\\', 1},
        {"?", "\xF0\x9F\x98\x80", '\\', 1},             // one character, four bytes
        {"a?", "a\xC3", '\\', 1},                       // a cut-short sequence is one character
        {"\xC0\xAA", "anything", '\\', 1},              // an overlong '*' is a star
        {"a", "\xC1\x81", '\\', 1},                    // an overlong 'A' folds on either side
        {"\xC1\x81", "a", '\\', 1},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(NvoLibStrLikeCompare(c.pattern, c.subject, c.esc), c.result)
            << "\"" << c.pattern << "\" \"" << c.subject << "\"";
    }
}

TEST(Matcher, HostileInputsEndQuickly) {
    EXPECT_EQ(NvoLibStrLikeCompare(nullptr, "a", '\\'), 0);
    EXPECT_EQ(NvoLibStrLikeCompare("a", nullptr, '\\'), 0);
    EXPECT_EQ(NvoLibStrLikeCompare(nullptr, nullptr, '\\'), 0);
    // Exponential for the recursion; bounded by pattern x subject length here.
    const std::string run(100000, 'a');
    EXPECT_EQ(NvoLibStrLikeCompare("*a*a*a*a*a*a*a*b", run.c_str(), '\\'), 0);
    EXPECT_EQ(NvoLibStrLikeCompare("*a*a*a*a*a*a*a*a", run.c_str(), '\\'), 1);
    std::string stars;
    for (int i = 0; i < 20000; ++i) {
        stars += "*a";
    }
    EXPECT_EQ(NvoLibStrLikeCompare((stars + "b").c_str(), run.c_str(), '\\'), 0);
    EXPECT_EQ(NvoLibStrLikeCompare(stars.c_str(), run.c_str(), '\\'), 1);
    const std::string questions(200000, '?');
    EXPECT_EQ(NvoLibStrLikeCompare(questions.c_str(), run.c_str(), '\\'), 0);
    EXPECT_EQ(NvoLibStrLikeCompare(("*" + questions).c_str(), run.c_str(), '\\'), 0);
    const std::string lead(100000, '\xF4');
    EXPECT_EQ(NvoLibStrLikeCompare(("*" + lead).c_str(), lead.c_str(), '\\'), 1);
}

}  // namespace
