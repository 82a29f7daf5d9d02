// String lists, their sort orders (against a plain insertion sort) and the tokenizer; and the
// error slot: its start, the place it records, and what success leaves in it.
#include <stdlib.h>
#include <string.h>
#include <strings.h>

#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "vlibc_err.h"
#include "vlibc_szlist.h"

namespace {

// First: a fresh process's slot is empty.
TEST(ErrorSlot, StartsEmptyAndKeepsTheCallersPlace) {
    EXPECT_EQ(VLIBCErrGet(), 0);
    EXPECT_STREQ(VLIBCErrorGetFile(), "");
    EXPECT_EQ(VLIBCErrorGetLine(), 0);

    int line = __LINE__ + 1;
    QUIB_SET_ERR(QUIB_ERR_NO_SUCH_USER);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_USER);
    EXPECT_STREQ(VLIBCErrorGetFile(), "szlist_test.cc");
    EXPECT_EQ(VLIBCErrorGetLine(), line);
    VLIBCErrSetEx(QUIB_ERR_NO_SUCH_FILE, nullptr, 7);
    EXPECT_STREQ(VLIBCErrorGetFile(), "");
    EXPECT_EQ(VLIBCErrorGetLine(), 7);
}

TEST(ErrorSlot, PlatformFailureNamesItsSourceAndSuccessKeepsIt) {
    PSZLIST list = VLIBCSzListAlloc(1);
    ASSERT_NE(list, nullptr);
    EXPECT_EQ(VLIBCSzListPush(nullptr, "x"), -1);
    EXPECT_STREQ(VLIBCErrorGetFile(), "szlist.cc") << "the name, not the build path";
    EXPECT_GT(VLIBCErrorGetLine(), 0);
    EXPECT_EQ(VLIBCSzListPush(&list, "ok"), 0);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    VLIBCSzListFree(list);
}

using Strings = std::vector<std::string>;

// Pushes through the pointer as callers do: it may move when the list grows.
PSZLIST Make(const Strings &items) {
    PSZLIST list = VLIBCSzListAlloc(1);
    for (const std::string &item : items) {
        EXPECT_EQ(VLIBCSzListPush(&list, item.c_str()), 0);
    }
    return list;
}

// The items, and the list freed.
Strings Take(PSZLIST list) {
    Strings out;
    for (int i = 0; i < VLIBCSzListCount(list); ++i) {
        out.emplace_back(VLIBCSzListGet(list, i));
    }
    VLIBCSzListFree(list);
    return out;
}

// Null lists count as empty; unknown sort flags are refused and change nothing.
TEST(SzList, BadArgumentsChangeNothing) {
    EXPECT_EQ(VLIBCSzListCount(nullptr), 0);
    EXPECT_EQ(VLIBCSzListGet(nullptr, 0), nullptr);
    PSZLIST list = Make({"b", "a"});
    for (int flags : {0x08, 0x20, 0x100, SZLIST_SORT_CASE_SENSITIVE | SZLIST_SORT_CASE_INSENSITIVE, -1}) {
        VLIBCErrSetEx(0, "", 0);
        EXPECT_EQ(VLIBCSzListSortItems(list, flags), -1) << flags;
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER) << flags;
    }
    EXPECT_EQ(VLIBCStrTok("a", ",", nullptr), -1);
    EXPECT_EQ(Take(list), (Strings{"b", "a"}));
}

int ReferenceCompare(const std::string &a, const std::string &b, int flags) {
    if (flags & SZLIST_SORT_NUMERIC) {
        long long x = strtoll(a.c_str(), nullptr, 10);
        long long y = strtoll(b.c_str(), nullptr, 10);
        return x < y ? -1 : (x > y ? 1 : 0);
    }
    return (flags & SZLIST_SORT_CASE_INSENSITIVE) ? strcasecmp(a.c_str(), b.c_str()) : strcmp(a.c_str(), b.c_str());
}

// An insertion sort: stable by construction.
Strings ReferenceSort(Strings items, int flags) {
    for (size_t i = 1; i < items.size(); ++i) {
        for (size_t j = i; j > 0; --j) {
            int cmp = ReferenceCompare(items[j - 1], items[j], flags);
            if ((flags & SZLIST_SORT_DESC) ? cmp >= 0 : cmp <= 0) {
                break;
            }
            std::swap(items[j - 1], items[j]);
        }
    }
    return items;
}

// Fixed points first: the reference follows the same reading of the flags, so it can't vouch for it.
TEST(SzListSort, OrdersAndAgreesWithReferenceOnGeneratedLists) {
    const struct { int flags; Strings input, expected; } rows[] = {
        {0, {"b", "B", "a", "A"}, {"A", "B", "a", "b"}},
        {SZLIST_SORT_CASE_INSENSITIVE, {"b", "B", "a", "A"}, {"a", "A", "b", "B"}},
        {SZLIST_SORT_CASE_INSENSITIVE | SZLIST_SORT_DESC, {"b", "B", "a", "A"}, {"b", "B", "a", "A"}},
        {SZLIST_SORT_NUMERIC, {"10", "9", "x", "-1", "09", "2abc"}, {"-1", "x", "2abc", "9", "09", "10"}},
        {0, {"\xc3\xa9t\xc3\xa9", "zoo", "Zoo"}, {"Zoo", "zoo", "\xc3\xa9t\xc3\xa9"}},
    };
    for (const auto &row : rows) {
        PSZLIST list = Make(row.input);
        ASSERT_EQ(VLIBCSzListSortItems(list, row.flags), 0);
        EXPECT_EQ(Take(list), row.expected) << "flags " << row.flags;
    }
    std::mt19937 rng(20240611);
    const char alphabet[] = "aAbB0129-_ \xc3\xa9";
    for (int round = 0; round < 300; ++round) {
        Strings items(rng() % 40);
        for (std::string &item : items) {
            for (size_t i = 0, len = rng() % 5; i < len; ++i) {
                item += alphabet[rng() % (sizeof alphabet - 1)];
            }
        }
        for (int flags : std::initializer_list<int>{0, SZLIST_SORT_DESC, SZLIST_SORT_CASE_SENSITIVE,
                                                    SZLIST_SORT_CASE_INSENSITIVE, SZLIST_SORT_CASE_INSENSITIVE | SZLIST_SORT_DESC,
                                                    SZLIST_SORT_NUMERIC, SZLIST_SORT_NUMERIC | SZLIST_SORT_DESC}) {
            PSZLIST list = Make(items);
            ASSERT_EQ(VLIBCSzListSortItems(list, flags), 0);
            ASSERT_EQ(Take(list), ReferenceSort(items, flags)) << "round " << round << " flags " << flags;
        }
    }
}

// Every split appends to a list that already holds "keep".
TEST(StrTok, SplitsAndAppends) {
    const struct { const char *text, *delims; Strings pieces; } rows[] = {
        {"a,b,c", ",", {"a", "b", "c"}}, {",,a,,b,,", ",", {"a", "b"}}, {"", ",", {}}, {",,,", ",", {}},
        {"a b,c\td", " ,\t", {"a", "b", "c", "d"}}, {"whole", "", {"whole"}},
        {"caf\xc3\xa9,th\xc3\xa9", ",", {"caf\xc3\xa9", "th\xc3\xa9"}},
    };
    for (const auto &row : rows) {
        PSZLIST list = Make({"keep"});
        EXPECT_EQ(VLIBCStrTok(row.text, row.delims, &list), static_cast<int>(row.pieces.size())) << row.text;
        Strings expected{"keep"};
        expected.insert(expected.end(), row.pieces.begin(), row.pieces.end());
        EXPECT_EQ(Take(list), expected) << row.text;
    }
}

}  // namespace
