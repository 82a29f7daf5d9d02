// The file-index records each condition builds, the chains linking makes, and the factory's
// results: records are read by walking their links, as the index would. Then the conditions
// asked about real files as a walk reads them. Which fields are refused with which code, and
// what each condition decides on any record, the find_factory fuzzer asserts; how a search
// joins them, the command's conditions test.
#include <fcntl.h>
#include <limits.h>
#include <stdint.h>
#include <time.h>
#include <unistd.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/norvosearch.h"
#include "quib_stat.h"

namespace {

using namespace FileSearch;
using Field = FindFactory::_tag_FIND_FIELD_;
using Chains = std::vector<std::string>;

// A record and everything its links reach: "{type op value &{and...} |{or...}}".
std::string Chain(const __tag_FI_SQL_COND *r, int depth = 0) {
    if (r == nullptr || depth > 64) {
        return r == nullptr ? "" : "{...}";
    }
    static const char *const kOps[] = {"=", "?1", "<", "?3", ">", ">=", "~", "?7", "path~", "path!~"};
    std::string text = "{" + std::to_string(r->type) + " " + (r->op < 10 ? kOps[r->op] : "?") + " " + r->value;
    if (r->andNext != nullptr) text += " &" + Chain(r->andNext, depth + 1);
    if (r->orNext != nullptr) text += " |" + Chain(r->orNext, depth + 1);
    return text + "}";
}

struct Owned {
    std::vector<FindComp *> list;
    ~Owned() {
        for (FindComp *c : list) delete c;
    }
    Chains chains() const {
        Chains out;
        for (FindComp *c : list) out.push_back(Chain(c->getFirstCond()));
        return out;
    }
};

std::string ChainOf(std::unique_ptr<FindComp> c) {
    return Chain(c->getFirstCond());
}

// What the factory table below cannot reach: null operators and names, the size tolerance
// at its edges, and the escapes of name terms.
TEST(Records, EachConstructorBuildsItsRecords) {
    const std::string longest = std::to_string(LLONG_MAX);
    const struct {
        std::function<FindComp *()> make;
        std::string chain;
    } cases[] = {
        {[] { return new FindNameComp("abc"); }, "{0 ~ *abc*}"},
        {[] { return new FindNameComp("a*c"); }, "{0 ~ a*c}"},
        {[] { return new FindNameComp("a\\*c"); }, "{0 ~ *a\\*c*}"},      // an escaped star is no wildcard
        {[] { return new FindNameComp("a\\*b*c"); }, "{0 ~ *a\\*b*c*}"},  // ... even beside a real one
        {[] { return new FindNameComp("a\\?c*"); }, "{0 ~ a\\?c*}"},
        {[] { return new FindNameComp("a\\\\b"); }, "{0 ~ *a\\b*}"},      // doubled backslash made single
        {[] { return new FindNameComp("a\\\\\\\\*"); }, "{0 ~ *a\\\\**}"},
        {[] { return new FindNameComp("abc\\"); }, "{0 ~ abc\\}"},        // ends in a backslash: not wrapped
        {[] { return new FindNameComp(""); }, "{0 = }"},
        {[] { return new FindNameComp(nullptr); }, "{0 = }"},
        {[] { return new FindUserComp(nullptr, 0xFFFFFFFFu); }, "{15 = 4294967295 |{17 ~ }}"},
        {[] { return new FindATimeComp(nullptr, -1); }, "{11 >= 18446744073709551615}"},
        {[] { return new FindSizeComp("equal", 10); }, "{7 < 11 &{7 >= 9}}"},
        {[] { return new FindSizeComp("equal", 0); }, "{7 < 1 &{7 >= 0}}"},
        {[] { return new FindSizeComp("equal", -100); }, "{7 < 18446744073709551517 &{7 >= 0}}"},
        {[] { return new FindSizeComp("equal", LLONG_MAX); },
         "{7 < " + longest + " &{7 >= " + std::to_string(LLONG_MAX - (LLONG_MAX >> 2) / 5) + "}}"},
        {[] { return new FindSizeComp(nullptr, 7); }, "{7 > 7}"},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(ChainOf(std::unique_ptr<FindComp>(c.make())), c.chain);
    }
}

// Alternatives head their chain, newest first; joining one twice, itself or in a circle (which
// would make each own the other) changes nothing.
TEST(Chains, AlternativesHeadTheirChainNewestFirst) {
    auto head = std::make_unique<FindNameComp>("a");
    auto *b = new FindNameComp("b");
    head->orComp(b);
    head->orComp(b);
    head->orComp(head.get());
    head->orComp(nullptr);
    b->orComp(head.get());
    head->orComp(new FindNameComp("c"));
    EXPECT_EQ(Chain(head->getFirstCond()), "{0 ~ *c* |{0 ~ *b* |{0 ~ *a*}}}");
}

class Factory : public ::testing::Test {
protected:
    void SetUp() override { app.Basic(); }
    norvo::testing::Appliance app;
};

TEST_F(Factory, AppendsTheConditionsOfEachField) {
    const std::string alice = std::to_string(app.Uid("alice"));
    const std::string staff = std::to_string(app.Gid("staff"));
    const std::string longTerm(5000, 'n');
    const struct {
        int field;
        const char *op;
        const char *value;
        Chains chains;
    } cases[] = {
        {0, nullptr, "a, b", {"{0 ~ *b* |{0 ~ *a*}}"}},
        {0, "ignored", " a\t", {"{0 ~ *a*}"}},
        {0, nullptr, "x,\"y\",z", {"{0 ~ *z* |{0 ~ *y*}}"}},  // x has no effect
        {0, nullptr, "\"a\",\"b\"", {"{0 ~ *a*}", "{0 ~ *b*}"}},
        {0, nullptr, " \"a*\" ", {"{0 ~ a*}"}},               // quotes go, the wrapping rule stays
        {0, nullptr, "\"\"", {"{0 ~ *\"\"*}"}},                // two characters: not a quoted term
        {0, nullptr, "a\\\\b,c\\*", {"{0 ~ *c\\** |{0 ~ *a\\b*}}"}},
        {0, nullptr, "", {}},
        {0, nullptr, " , ,\t", {}},
        {1, "DIR", nullptr, {"{6 = 1}"}},
        {1, "File", "ignored", {"{6 = 0}"}},
        {1, "folder", nullptr, {}},
        {2, nullptr, "jpg,png", {"{6 = 0}", "{0 ~ *.png |{0 ~ *.jpg}}"}},
        {2, nullptr, " jpg,", {"{6 = 0}", "{0 ~ *. |{0 ~ *. jpg}}"}},  // neither trimmed nor skipped
        {3, nullptr, "alice", {"{15 = " + alice + " |{17 ~ alice}}"}},
        {4, nullptr, "staff", {"{16 = " + staff + " |{18 ~ staff}}"}},
        {5, "before", "1000", {"{12 < 1000}"}},
        {5, "Before", "12abc", {"{12 < 12}"}},
        {6, "after", "abc", {"{9 >= 0}"}},
        {7, "", "-5", {"{11 >= 18446744073709551611}"}},
        {7, "x", "99999999999999999999999", {"{11 >= 18446744073709551615}"}},
        {8, "equal", "100", {"{7 < 105 &{7 >= 95}}"}},
        {8, "EQUAL", "100", {"{7 > 100}"}},
        {8, "less", "1k", {"{7 < 1}"}},
        {0, nullptr, longTerm.c_str(), {"{0 ~ *" + std::string(4094, 'n') + "}"}},  // cut to the record
        {9, nullptr, "x", {}},
        {-1, "x", "y", {}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(std::to_string(c.field) + " " + (c.value ? c.value : "(null)"));
        Owned out;
        NvoLibSetErr(NVO_ERR_NONE);
        EXPECT_TRUE(FindFactory::createFindOp(static_cast<Field>(c.field), c.op, c.value, out.list));
        EXPECT_EQ(out.chains(), c.chains);
        EXPECT_EQ(NvoLibGetErr(), NVO_ERR_NONE);
    }
}

// Whether the condition lets path through, as a walk asks it: birth times and times beyond 32
// bits of real files. (Every condition against find(1) on generated trees: the search
// walker's test.)
bool Asks(const std::function<FindComp *()> &make, const std::string &path) {
    std::unique_ptr<FindComp> condition(make());
    QUIBSTAT st{};
    EXPECT_EQ(VLIBCFileLStat(path.c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st), 0) << path;
    return (*condition)(path.c_str(), st);
}

TEST(Match, RealFilesAsTheWalkReadsThem) {
    norvo::testing::Appliance app;
    app.Basic();
    const std::string file = "/volume1/public/d/f.txt";
    app.WriteFile(file, "x");
    const long now = static_cast<long>(time(nullptr));
    EXPECT_TRUE(Asks([=] { return new FindCRTimeComp("after", now - 60); }, file));
    EXPECT_FALSE(Asks([=] { return new FindCRTimeComp("before", now - 60); }, file));

    // Times beyond 32 bits saturate; they never wrap round.
    const timespec far[2] = {{-(1LL << 33), 0}, {1LL << 33, 0}};  // atime, mtime
    ASSERT_EQ(utimensat(AT_FDCWD, file.c_str(), far, 0), 0);
    EXPECT_TRUE(Asks([] { return new FindMTimeComp("after", INT32_MAX); }, file));
    EXPECT_TRUE(Asks([] { return new FindATimeComp("before", INT32_MIN + 1); }, file));
    EXPECT_FALSE(FindNameComp("abc")(nullptr, QUIBSTAT{}));
}

}  // namespace
