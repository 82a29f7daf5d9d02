// String lists, their sort orders (against a plain insertion sort) and the tokenizer.
#include <stdlib.h>
#include <string.h>
#include <strings.h>

#include <memory>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "vlibc_err.h"
#include "vlibc_szlist.h"

namespace {

using Strings = std::vector<std::string>;
struct ListFree {
    void operator()(PSZLIST list) const { VLIBCSzListFree(list); }
};
using List = std::unique_ptr<SZLIST, ListFree>;

// Pushes through a raw pointer, as callers do: *plist may move when the list grows.
List Make(const Strings &items) {
    PSZLIST raw = VLIBCSzListAlloc(1);
    for (const std::string &item : items) {
        EXPECT_EQ(VLIBCSzListPush(&raw, item.c_str()), 0);
    }
    return List(raw);
}

Strings Items(const List &list) {
    Strings out;
    for (int i = 0; i < VLIBCSzListCount(list.get()); ++i) {
        out.emplace_back(VLIBCSzListGet(list.get(), i));
    }
    return out;
}

TEST(SzList, GrowsPastItsCapacityAndKeepsCopies) {
    List list(VLIBCSzListAlloc(0));
    ASSERT_NE(list, nullptr);
    EXPECT_GE(list->nAlloc, 1);
    char buf[32];
    for (int i = 0; i < 1000; ++i) {
        snprintf(buf, sizeof buf, "item%d", i);
        PSZLIST raw = list.release();
        ASSERT_EQ(VLIBCSzListPush(&raw, buf), 0);
        list.reset(raw);
    }
    strcpy(buf, "changed");
    ASSERT_EQ(VLIBCSzListCount(list.get()), 1000);
    EXPECT_STREQ(VLIBCSzListGet(list.get(), 0), "item0");
    EXPECT_STREQ(VLIBCSzListGet(list.get(), 999), "item999");
    EXPECT_EQ(VLIBCSzListGet(list.get(), 1000), nullptr);
    EXPECT_EQ(VLIBCSzListGet(list.get(), -1), nullptr);

    int capacity = list->nAlloc;
    VLIBCSzListRemoveAll(list.get());
    EXPECT_EQ(VLIBCSzListCount(list.get()), 0);
    EXPECT_EQ(list->nAlloc, capacity);
    EXPECT_EQ(VLIBCSzListGet(list.get(), 0), nullptr);
}

TEST(SzList, NullAndBadArgumentsChangeNothing) {
    EXPECT_EQ(VLIBCSzListCount(nullptr), 0);
    EXPECT_EQ(VLIBCSzListGet(nullptr, 0), nullptr);
    VLIBCSzListFree(nullptr);
    VLIBCSzListRemoveAll(nullptr);
    List list = Make({});
    PSZLIST raw = list.get();
    PSZLIST none = nullptr;
    const struct {
        const char *what;
        int rc;
    } rows[] = {
        {"push to null", VLIBCSzListPush(nullptr, "x")},
        {"push to *null", VLIBCSzListPush(&none, "x")},
        {"push null", VLIBCSzListPush(&raw, nullptr)},
        {"sort null", VLIBCSzListSortItems(nullptr, 0)},
        {"split null", VLIBCStrTok(nullptr, ",", &raw)},
        {"split by null", VLIBCStrTok("a", nullptr, &raw)},
        {"split into null", VLIBCStrTok("a", ",", nullptr)},
        {"split into *null", VLIBCStrTok("a", ",", &none)},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(row.rc, -1) << row.what;
    }
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(VLIBCSzListCount(list.get()), 0);
    EXPECT_EQ(none, nullptr);

    for (int flags : {0x08, 0x20, 0x100, SZLIST_SORT_CASE_SENSITIVE | SZLIST_SORT_CASE_INSENSITIVE, -1}) {
        List two = Make({"b", "a"});
        VLIBCErrSetEx(0, "", 0);
        EXPECT_EQ(VLIBCSzListSortItems(two.get(), flags), -1) << flags;
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER) << flags;
        EXPECT_EQ(Items(two), (Strings{"b", "a"})) << flags;
    }
}

// Fixed points the reference below can't vouch for, as it follows the same reading of the flags.
TEST(SzListSort, Orders) {
    const struct {
        int flags;
        Strings input;
        Strings expected;
    } rows[] = {
        {0, {"b", "B", "a", "A"}, {"A", "B", "a", "b"}},
        {SZLIST_SORT_CASE_INSENSITIVE, {"b", "B", "a", "A"}, {"a", "A", "b", "B"}},
        {SZLIST_SORT_CASE_INSENSITIVE | SZLIST_SORT_DESC, {"b", "B", "a", "A"}, {"b", "B", "a", "A"}},
        {SZLIST_SORT_NUMERIC, {"10", "9", "x", "-1", "09", "2abc"}, {"-1", "x", "2abc", "9", "09", "10"}},
        {0, {"\xc3\xa9t\xc3\xa9", "zoo", "Zoo"}, {"Zoo", "zoo", "\xc3\xa9t\xc3\xa9"}},
    };
    for (const auto &row : rows) {
        List list = Make(row.input);
        ASSERT_EQ(VLIBCSzListSortItems(list.get(), row.flags), 0);
        EXPECT_EQ(Items(list), row.expected) << "flags " << row.flags;
    }
}

int ReferenceCompare(const std::string &a, const std::string &b, int flags) {
    if (flags & SZLIST_SORT_NUMERIC) {
        long long x = strtoll(a.c_str(), nullptr, 10);
        long long y = strtoll(b.c_str(), nullptr, 10);
        return x < y ? -1 : (x > y ? 1 : 0);
    }
    return (flags & SZLIST_SORT_CASE_INSENSITIVE) ? strcasecmp(a.c_str(), b.c_str())
                                                  : strcmp(a.c_str(), b.c_str());
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

TEST(SzListSort, AgreesWithReferenceOnGeneratedLists) {
    std::mt19937 rng(20240611);
    const char alphabet[] = "aAbB0129-_ \xc3\xa9";
    const int flagSets[] = {0,
                            SZLIST_SORT_DESC,
                            SZLIST_SORT_CASE_SENSITIVE,
                            SZLIST_SORT_CASE_INSENSITIVE,
                            SZLIST_SORT_CASE_INSENSITIVE | SZLIST_SORT_DESC,
                            SZLIST_SORT_NUMERIC,
                            SZLIST_SORT_NUMERIC | SZLIST_SORT_DESC};
    for (int round = 0; round < 300; ++round) {
        Strings items(rng() % 40);
        for (std::string &item : items) {
            for (size_t i = 0, len = rng() % 5; i < len; ++i) {
                item += alphabet[rng() % (sizeof alphabet - 1)];
            }
        }
        for (int flags : flagSets) {
            List list = Make(items);
            ASSERT_EQ(VLIBCSzListSortItems(list.get(), flags), 0);
            ASSERT_EQ(Items(list), ReferenceSort(items, flags)) << "round " << round << " flags " << flags;
        }
    }
}

// Every split appends to a list that already holds "keep".
TEST(StrTok, SplitsAndAppends) {
    const struct {
        const char *text;
        const char *delims;
        Strings pieces;
    } rows[] = {
        {"a,b,c", ",", {"a", "b", "c"}},
        {",,a,,b,,", ",", {"a", "b"}},
        {"", ",", {}},
        {",,,", ",", {}},
        {"a b,c\td", " ,\t", {"a", "b", "c", "d"}},
        {"whole", "", {"whole"}},
        {"caf\xc3\xa9,th\xc3\xa9", ",", {"caf\xc3\xa9", "th\xc3\xa9"}},
    };
    for (const auto &row : rows) {
        PSZLIST raw = Make({"keep"}).release();
        EXPECT_EQ(VLIBCStrTok(row.text, row.delims, &raw), static_cast<int>(row.pieces.size())) << row.text;
        List list(raw);
        Strings expected{"keep"};
        expected.insert(expected.end(), row.pieces.begin(), row.pieces.end());
        EXPECT_EQ(Items(list), expected) << row.text;
    }
}

}  // namespace
