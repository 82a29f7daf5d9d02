// The wildcard matcher: its case folding against ICU, the described cases and hostile inputs.
// Its agreement with the recursive definition is the like_compare fuzzer's.
#include <stdint.h>

#include <string>

#include <gtest/gtest.h>
#include <unicode/uchar.h>

#include "norvo/norvomisc.h"

namespace {

// ICU's own default case folding, the reference the matcher must agree with.
UChar32 IcuFold(UChar32 c) {
    return u_foldCase(c, U_FOLD_CASE_DEFAULT);
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

// The rules of the definition, each with its example.
TEST(Matcher, DescribedCases) {
    struct Case {
        const char *pattern;
        const char *subject;
        int esc;
        int result;
    } cases[] = {
        {"*.JPG", "a.jpg", '\\', 1}, {"100\\%", "100%", '\\', 1}, {"a?c", "abbc", '\\', 0},
        {"a\\", "a", '\\', 1},          // an escape with nothing after it ends the pattern
        {"*\\", "a", '\\', 0},          // ... but after a star the rest is never tried at the end
        {"*??", "a", '\\', 0},          // question marks after a star need their characters
        {"a*", "a", '*', 1},            // the star is recognised before the escape character
        {"\xCF\x82", "\xCE\xA3", '\\', 1},              // final sigma and capital sigma fold alike
        {"k", "\xE2\x84\xAA", '\\', 1},                 // Kelvin sign folds to k
        {"?", "\xF0\x9F\x98\x80", '\\', 1},             // one character, four bytes
        {"a?", "a\xC3", '\\', 1},                       // a cut-short sequence is one character
        {"\xC0\xAA", "anything", '\\', 1},              // an overlong '*' is a star
        {"a", "\xC1\x81", '\\', 1},                    // an overlong 'A' folds on either side
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
