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

struct ListFree {
    void operator()(PSZLIST list) const { VLIBCSzListFree(list); }
};
using List = std::unique_ptr<SZLIST, ListFree>;

List Make(const std::vector<std::string> &items) {
    List list(VLIBCSzListAlloc(1));
    EXPECT_NE(list, nullptr);
    for (const std::string &item : items) {
        PSZLIST raw = list.release();
        EXPECT_EQ(VLIBCSzListPush(&raw, item.c_str()), 0);
        list.reset(raw);
    }
    return list;
}

std::vector<std::string> Items(const List &list) {
    std::vector<std::string> out;
    for (int i = 0; i < VLIBCSzListCount(list.get()); ++i) {
        out.emplace_back(VLIBCSzListGet(list.get(), i));
    }
    return out;
}

using Strings = std::vector<std::string>;

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
    strcpy(buf, "changed");  // the list holds its own copies
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

TEST(SzList, NullAndBadArguments) {
    EXPECT_EQ(VLIBCSzListCount(nullptr), 0);
    EXPECT_EQ(VLIBCSzListGet(nullptr, 0), nullptr);
    VLIBCSzListFree(nullptr);
    VLIBCSzListRemoveAll(nullptr);

    EXPECT_EQ(VLIBCSzListPush(nullptr, "x"), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    PSZLIST none = nullptr;
    EXPECT_EQ(VLIBCSzListPush(&none, "x"), -1);
    List list = Make({});
    PSZLIST raw = list.get();
    EXPECT_EQ(VLIBCSzListPush(&raw, nullptr), -1);
    EXPECT_EQ(VLIBCSzListSortItems(nullptr, 0), -1);
    EXPECT_EQ(VLIBCSzListCount(list.get()), 0);
}

TEST(SzList, PushKeepsArbitraryBytes) {
    List list = Make({"", "caf\xc3\xa9", "\xff\xfe"});
    EXPECT_EQ(Items(list), (Strings{"", "caf\xc3\xa9", "\xff\xfe"}));
}

TEST(SzListSort, Orders) {
    const struct {
        int flags;
        Strings input;
        Strings expected;
    } cases[] = {
        {0, {"b", "B", "a", "A"}, {"A", "B", "a", "b"}},
        {SZLIST_SORT_CASE_SENSITIVE, {"b", "B", "a", "A"}, {"A", "B", "a", "b"}},
        // Stable: items equal ignoring case keep their input order.
        {SZLIST_SORT_CASE_INSENSITIVE, {"b", "B", "a", "A"}, {"a", "A", "b", "B"}},
        {SZLIST_SORT_CASE_INSENSITIVE, {"Photo", "music", "homes", "Music"},
         {"homes", "music", "Music", "Photo"}},
        {SZLIST_SORT_CASE_INSENSITIVE | SZLIST_SORT_DESC, {"b", "B", "a", "A"}, {"b", "B", "a", "A"}},
        {SZLIST_SORT_DESC, {"a", "c", "b"}, {"c", "b", "a"}},
        // Numeric: the leading integer; none counts as 0; equal numbers keep their order.
        {SZLIST_SORT_NUMERIC, {"10", "9", "x", "-1", "09", "2abc"}, {"-1", "x", "2abc", "9", "09", "10"}},
        {SZLIST_SORT_NUMERIC | SZLIST_SORT_DESC, {"1", "30", "200"}, {"200", "30", "1"}},
        {0, {}, {}},
        {0, {"only"}, {"only"}},
        // Byte order: UTF-8 sorts after ASCII.
        {0, {"\xc3\xa9t\xc3\xa9", "zoo", "Zoo"}, {"Zoo", "zoo", "\xc3\xa9t\xc3\xa9"}},
    };
    for (const auto &c : cases) {
        List list = Make(c.input);
        ASSERT_EQ(VLIBCSzListSortItems(list.get(), c.flags), 0);
        EXPECT_EQ(Items(list), c.expected) << "flags " << c.flags;
    }
}

TEST(SzListSort, RejectsUnknownOrContradictoryFlags) {
    for (int flags : {0x08, 0x20, 0x100, SZLIST_SORT_CASE_SENSITIVE | SZLIST_SORT_CASE_INSENSITIVE, -1}) {
        List list = Make({"b", "a"});
        EXPECT_EQ(VLIBCSzListSortItems(list.get(), flags), -1) << flags;
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
        EXPECT_EQ(Items(list), (Strings{"b", "a"}));
    }
}

// The reference: an insertion sort, stable by construction, over the documented comparisons.
int ReferenceCompare(const std::string &a, const std::string &b, int flags) {
    if (flags & SZLIST_SORT_NUMERIC) {
        long long x = strtoll(a.c_str(), nullptr, 10);
        long long y = strtoll(b.c_str(), nullptr, 10);
        return x < y ? -1 : (x > y ? 1 : 0);
    }
    return (flags & SZLIST_SORT_CASE_INSENSITIVE) ? strcasecmp(a.c_str(), b.c_str())
                                                  : strcmp(a.c_str(), b.c_str());
}

Strings ReferenceSort(Strings items, int flags) {
    for (size_t i = 1; i < items.size(); ++i) {
        for (size_t j = i; j > 0; --j) {
            int cmp = ReferenceCompare(items[j - 1], items[j], flags);
            bool outOfOrder = (flags & SZLIST_SORT_DESC) ? cmp < 0 : cmp > 0;
            if (!outOfOrder) {
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
            size_t len = rng() % 5;
            for (size_t i = 0; i < len; ++i) {
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

TEST(StrTok, Splits) {
    const struct {
        const char *text;
        const char *delims;
        Strings expected;
    } cases[] = {
        {"a,b,c", ",", {"a", "b", "c"}},
        {"a,,b", ",", {"a", "b"}},
        {",,a,b,,", ",", {"a", "b"}},
        {"", ",", {}},
        {",,,", ",", {}},
        {"a b,c\td", " ,\t", {"a", "b", "c", "d"}},
        {"no delimiter", ",", {"no delimiter"}},
        {"whole", "", {"whole"}},
        {"caf\xc3\xa9,th\xc3\xa9", ",", {"caf\xc3\xa9", "th\xc3\xa9"}},
    };
    for (const auto &c : cases) {
        List list = Make({});
        PSZLIST raw = list.release();
        EXPECT_EQ(VLIBCStrTok(c.text, c.delims, &raw), static_cast<int>(c.expected.size())) << c.text;
        list.reset(raw);
        EXPECT_EQ(Items(list), c.expected) << c.text;
    }
}

TEST(StrTok, AppendsToWhatIsThere) {
    List list = Make({"keep"});
    PSZLIST raw = list.release();
    EXPECT_EQ(VLIBCStrTok("x:y", ":", &raw), 2);
    list.reset(raw);
    EXPECT_EQ(Items(list), (Strings{"keep", "x", "y"}));
}

TEST(StrTok, ManyPiecesGrowTheList) {
    std::string text;
    for (int i = 0; i < 5000; ++i) {
        text += std::to_string(i) + ";";
    }
    List list = Make({});
    PSZLIST raw = list.release();
    EXPECT_EQ(VLIBCStrTok(text.c_str(), ";", &raw), 5000);
    list.reset(raw);
    EXPECT_STREQ(VLIBCSzListGet(list.get(), 4999), "4999");
}

TEST(StrTok, BadArguments) {
    List list = Make({});
    PSZLIST raw = list.get();
    PSZLIST none = nullptr;
    EXPECT_EQ(VLIBCStrTok(nullptr, ",", &raw), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(VLIBCStrTok("a", nullptr, &raw), -1);
    EXPECT_EQ(VLIBCStrTok("a", ",", nullptr), -1);
    EXPECT_EQ(VLIBCStrTok("a", ",", &none), -1);
    EXPECT_EQ(VLIBCSzListCount(list.get()), 0);
}

}  // namespace
