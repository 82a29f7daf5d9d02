// Replacement, case, extensions, sizes, UTF-8 form, hex, splitting and path lists; and the
// wildcard matcher: its case folding against ICU, the described cases and hostile inputs (its
// agreement with the recursive definition is the like_compare fuzzer's).
#include <stdlib.h>

#include <algorithm>
#include <iterator>
#include <memory>
#include <utility>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <json/value.h>
#include <unicode/uchar.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/norvomisc.h"

namespace {

using Lines = std::vector<std::string>;
using Pieces = std::vector<std::string>;

// The result and *out ("(null)" when null), which is freed.
using Replaced = std::pair<int, std::string>;
Replaced Taken(int result, char *out) {
    const std::unique_ptr<char, decltype(&free)> owned(out, &free);
    return {result, out != nullptr ? out : "(null)"};
}
Replaced Replace(const char *src, const char *from, const char *to) {
    char *out = nullptr;
    const int result = NvoLibStrReplace(src, from, to, &out);
    return Taken(result, out);
}
Replaced Replace2(const char *src, const char *from1, const char *to1, const char *from2, const char *to2) {
    char *out = nullptr;
    const int result = NvoLibTwoStrReplace(src, from1, to1, from2, to2, &out);
    return Taken(result, out);
}

TEST(Replace, DescribedCasesAndBadArguments) {
    EXPECT_EQ(Replace("aaa", "a", "aa"), (Replaced{1, "aaaaaa"}));  // inserted text is not searched
    EXPECT_EQ(Replace2("abc", "b", "X", "ab", "Y"), (Replaced{1, "Yc"}));  // the earliest place wins
    const Replaced refused{-1, "(null)"};  // an empty replacement is refused too
    for (const char *src : {static_cast<const char *>(nullptr), ""}) {
        EXPECT_EQ(Replace(src, "a", "b"), refused);
        EXPECT_EQ(Replace2(src, "a", "b", "c", "d"), refused);
    }
    const char *badPairs[][2] = {{nullptr, "b"}, {"a", nullptr}, {"", "b"}, {"a", ""}};
    for (const auto &pair : badPairs) {
        EXPECT_EQ(Replace("a", pair[0], pair[1]), refused);
        EXPECT_EQ(Replace2("a", pair[0], pair[1], "x", "y"), refused);
        EXPECT_EQ(Replace2("a", "x", "y", pair[0], pair[1]), refused);
    }
    EXPECT_EQ(NvoLibStrReplace("a", "a", "b", nullptr), -1);
    EXPECT_EQ(NvoLibTwoStrReplace("a", "a", "b", "c", "d", nullptr), -1);
}

// A plain single pass: at each position the pairs in order, else one byte copied.
Replaced ReplaceReference(const std::string &src, const std::vector<std::string> &pairs) {
    std::string out;
    int replaced = 0;
    for (size_t at = 0; at < src.size();) {
        size_t k = 0;
        while (k < pairs.size() && src.compare(at, pairs[k].size(), pairs[k]) != 0) {
            k += 2;
        }
        if (k >= pairs.size()) {
            out += src[at++];
        } else {
            out += pairs[k + 1];
            at += pairs[k].size();
            replaced = 1;
        }
    }
    return {replaced, out};
}

TEST(Replace, EqualsAPlainScanOnGeneratedTexts) {
    std::mt19937 rng(7);
    const auto text = [&rng](size_t max) {
        std::string s(1 + rng() % max, 'a');
        for (char &c : s) {
            c = "ab\\x"[rng() % 4];
        }
        return s;
    };
    for (int i = 0; i < 5000; ++i) {
        const std::string src = text(12);
        const std::vector<std::string> p = {text(3), text(3), text(3), text(3)};
        ASSERT_EQ(Replace(src.c_str(), p[0].c_str(), p[1].c_str()), ReplaceReference(src, {p[0], p[1]}));
        ASSERT_EQ(Replace2(src.c_str(), p[0].c_str(), p[1].c_str(), p[2].c_str(), p[3].c_str()),
                  ReplaceReference(src, p))
            << src << " " << p[0] << ">" << p[1] << " " << p[2] << ">" << p[3];
    }
}

TEST(BytesAndNames, LowerExtensionsAndSizes) {
    char text[] = "AbC\xC3\x89-Z";
    EXPECT_EQ(NvoLibStringToLower(text), 0);
    EXPECT_STREQ(text, "abc\xC3\x89-z");  // bytes, not code points
    EXPECT_EQ(NvoLibStringToLower(nullptr), -1);

    struct Ext {
        const char *name;
        int start;
        const char *ext;
    } exts[] = {
        {"archive.tar.gz", 0, "gz"}, {"archive.tar.gz", 10, "tar.gz"}, {"archive.tar.gz", 1, "gz"},
        {"archive.tar.gz", 14, "gz"}, {"archive.tar.gz", 99, "gz"}, {"archive.tar.gz", -3, "gz"},
        {"name.", 0, nullptr}, {".profile", 0, nullptr}, {"..a", 0, "a"}, {"a.b", 0, "b"}, {"ab", 0, nullptr},
        {"a", 0, nullptr}, {"", 0, nullptr}, {nullptr, 0, nullptr}, {"a.b.", 2, "b."},
    };
    for (const Ext &e : exts) {
        const char *got = ReturnFileExt(e.name, e.start);
        EXPECT_STREQ(got, e.ext) << (e.name ? e.name : "(null)") << " " << e.start;
    }

    struct Size {
        long long bytes;
        bool fraction;
        const char *text;
    } sizes[] = {
        {1, false, "1 Bytes"}, {1023, false, "1023 Bytes"}, {1023, true, "1023 Bytes"}, {1024, false, "1 KB"},
        {1024, true, " 1.00 KB"}, {1536, true, " 1.50 KB"}, {(1 << 20) - 1, false, "1023 KB"},
        {(1 << 20) - 1, true, "1024.00 KB"}, {1 << 20, false, "1 MB"}, {5 << 20, true, " 5.00 MB"},
        {1LL << 30, false, "1 GB"}, {(1LL << 30) * 19 / 10, false, "1 GB"}, {(1LL << 30) * 19 / 10, true, " 1.90 GB"},
        {1LL << 50, false, "1048576 GB"},
    };
    for (const Size &s : sizes) {
        char buf[32] = "untouched";
        EXPECT_EQ(FileUnitGet(s.bytes, buf, sizeof buf, s.fraction), 1);
        EXPECT_STREQ(buf, s.text) << s.bytes;
    }
    char small[5] = "xxxx";
    EXPECT_EQ(FileUnitGet(123456, small, sizeof small, false), 1);
    EXPECT_STREQ(small, "120 ");  // cut to the buffer, always terminated
    for (const long long bad : {0LL, -1LL}) {
        char buf[16] = "untouched";
        EXPECT_EQ(FileUnitGet(bad, buf, sizeof buf, true), 0);
        EXPECT_STREQ(buf, "untouched");
    }
    EXPECT_EQ(FileUnitGet(5, nullptr, 16, false), 0);
    EXPECT_EQ(FileUnitGet(5, small, 0, false), 0);
    EXPECT_EQ(FileUnitGet(5, small, -1, false), 0);
}

TEST(BytesAndNames, Utf8FormAndHex) {
    struct Form {
        const char *text;
        int valid;
    } forms[] = {
        {nullptr, 1}, {"", 1}, {"plain", 1}, {"caf\xC3\xA9", 1}, {"\xF0\x9F\x98\x80", 1},
        {"\xC0\x80", 1},                      // overlong: passes
        {"\xED\xA0\x80", 1},                  // surrogate: passes
        {"\xF8\x88\x80\x80\x80", 1}, {"\xFC\x84\x80\x80\x80\x80", 1},  // five and six bytes
        {"\xC3", 0}, {"a\xE2\x82", 0}, {"\xE2\x82" "A", 0}, {"\x80", 0}, {"a\xBF", 0}, {"\xFE", 0}, {"\xFF", 0},
    };
    for (const Form &f : forms) {
        EXPECT_EQ(IsUnicodeString(f.text), f.valid) << (f.text ? f.text : "(null)");
    }
    struct Hex {
        const char *hex;
        std::string bin;
    } hexes[] = {
        {"414243", "ABC"}, {"41424", "AB"}, {"4", ""}, {"", ""}, {nullptr, ""}, {"410042", "A"}, {"zz41", ""},
        {"4g", "\x04"}, {"fF7e", "\xFF\x7E"}, {"-1", "\xFF"},
    };
    for (const Hex &h : hexes) {
        EXPECT_EQ(NvoLibHex2Bin(h.hex), h.bin) << (h.hex ? h.hex : "(null)");
    }
}

// The plain reading of the splitting rules, for generated texts.
Pieces SplitReference(const std::string &text, const std::string &delim) {
    Pieces out;
    std::string piece;
    for (size_t i = 0; i < text.size();) {
        if (text.compare(i, delim.size(), delim) == 0) {
            if (i != 0) {
                out.push_back(piece);
            }
            piece.clear();
            i += delim.size();
        } else {
            piece += text[i++];
        }
    }
    out.push_back(piece);
    return out;
}

TEST(Split, DescribedCasesAndGeneratedTexts) {
    Pieces out{"kept"};
    StringExplode(out, ",a,,b,", ",");
    EXPECT_EQ(out, (Pieces{"kept", "a", "", "b", ""}));  // appended to what was there
    StringExplode(out, "a,b", "");
    StringExplode(out, "a,b", nullptr);
    EXPECT_EQ(out.size(), 5u);
    std::string names = "left alone";
    StringExplodeToFileNameString(names, "/a", "", ", ");
    EXPECT_EQ(names, "left alone");
    StringExplodeToFileNameString(names, "/a/x.txt:/b/y.txt", ":", ", ");
    EXPECT_EQ(names, "x.txt, y.txt");

    std::mt19937 rng(11);
    const char *delims[] = {",", "::", "/", "ab"};
    for (int i = 0; i < 3000; ++i) {
        std::string text;
        for (size_t n = rng() % 14; n > 0; --n) {
            text += "ab,:/x"[rng() % 6];
        }
        const std::string delim = delims[rng() % std::size(delims)];
        const Pieces expected = SplitReference(text, delim);
        Pieces pieces;
        StringExplode(pieces, text, delim.c_str());
        ASSERT_EQ(pieces, expected) << text << " on " << delim;
        Pieces called;
        const auto collect = [](const std::string &piece, void *user) { static_cast<Pieces *>(user)->push_back(piece); };
        StringExplode(text, delim.c_str(), collect, &called);
        ASSERT_EQ(called, expected);
        std::string joined;
        for (size_t k = 0; k < expected.size(); ++k) {
            joined += (k == 0 ? "" : " | ") + expected[k].substr(expected[k].rfind('/') + 1);
        }
        std::string fileNames = "old";
        StringExplodeToFileNameString(fileNames, text, delim.c_str(), " | ");
        ASSERT_EQ(fileNames, joined) << text << " on " << delim;
    }
}

TEST(PathLists, JsonArraysAreJoined) {
    norvo::testing::Appliance app;
    Json::Value paths(Json::arrayValue);
    for (const char *p : {"/photo/a.jpg", "plain", "vol:/photo/b/", "", "x"}) {
        paths.append(p);
    }
    paths.append(7);
    paths.append(Json::Value(Json::objectValue));  // has no text
    std::string out = "old";
    EXPECT_EQ(ParseJsonPathToString(paths, out), 1);
    EXPECT_EQ(out, "/photo/a.jpg, plain, /photo/b/, , x, 7, ");
    EXPECT_EQ(ParseJsonPathToString(Json::Value(Json::arrayValue), out), 1);
    EXPECT_EQ(out, "");
    for (const Json::Value &bad : {Json::Value("/photo"), Json::Value(Json::objectValue), Json::Value()}) {
        out = "old";
        NvoLibSetErr(0);
        EXPECT_EQ(ParseJsonPathToString(bad, out), 0);
        EXPECT_EQ(NvoLibGetErr(), NVO_ERR_SYSTEM);
        EXPECT_EQ(out, "old");
    }
    EXPECT_EQ(app.ErrorLines(), (Lines(3, "norvomisc.cpp:# Wrong JSON format")));
}

// The longest common prefix of the slash-terminated paths, cut back to its last "/".
std::string ParentReference(Pieces paths) {
    if (paths.empty()) {
        return "";
    }
    for (std::string &p : paths) {
        if (!p.empty() && p.back() != '/') {
            p += '/';
        }
    }
    std::string prefix = paths[0];
    for (const std::string &p : paths) {
        prefix.resize(std::mismatch(prefix.begin(), prefix.end(), p.begin(), p.end()).first - prefix.begin());
    }
    const size_t slash = prefix.rfind('/');
    return slash == std::string::npos ? prefix : prefix.substr(0, slash + 1);
}

TEST(PathLists, CommonParent) {
    EXPECT_EQ(FindCommonParent({"/a/b/c", "/a/b/d"}), "/a/b/");
    EXPECT_EQ(FindCommonParent({"/a/bc", "/a/bd"}), "/a/");
    EXPECT_EQ(FindCommonParent({"/a/b", "/a/b"}), "/a/b/");
    EXPECT_EQ(FindCommonParent({"ab", "ac"}), "a");  // no common directory: the prefix stays
    EXPECT_EQ(FindCommonParent({}), "");
    EXPECT_EQ(FindCommonParent({"", ""}), "");
    std::mt19937 rng(3);
    for (int i = 0; i < 3000; ++i) {
        Pieces paths;
        for (size_t n = 1 + rng() % 4; n > 0; --n) {
            std::string p;
            for (size_t k = rng() % 8; k > 0; --k) {
                p += "/ab"[rng() % 3];
            }
            paths.push_back(p);
        }
        ASSERT_EQ(FindCommonParent(paths), ParentReference(paths)) << ::testing::PrintToString(paths);
    }
}

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
