// The order of listings and the page cut: the case-insensitive comparison against ICU's whole
// string comparison, every sort key with ties, and slices at the edges; then the JSON object of
// one entry, flag by flag, as the web interface receives it.
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <json/json.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>
#include <unicode/ustring.h>

#include "norvo/norvoenum.h"
#include "vlibc_unicode.h"

namespace {

int Sign(int v) {
    return (v > 0) - (v < 0);
}

// Beside ICU below: bytes that are not UTF-8, null pointers and long names.
TEST(CaseCompare, FoldsCaseInCodePointOrder) {
    const struct {
        const char *a;
        const char *b;
        int sign;
    } table[] = {
        {"_", "a", -1},          {"Stra\xc3\x9f" "e", "STRASSE", 0},  // '_' sorts before letters
        {"x\xff", "X\xff", 0},   {"\xff", "\xfe", 1},      {"a\xff", "a\xef\xbf\xbd", -1},  // not U+FFFD
        {nullptr, "", -1},       {nullptr, nullptr, 0},    {"", nullptr, 1},
    };
    for (const auto &row : table) {
        EXPECT_EQ(Sign(VLIBCUnicodeUTF8StrCaseCmp(row.a, row.b)), row.sign)
            << (row.a ? row.a : "null") << " / " << (row.b ? row.b : "null");
    }
    const std::string longName = std::string(3000, 'a') + "\xc3\xa9";
    EXPECT_EQ(VLIBCUnicodeUTF8StrCaseCmp(longName.c_str(), (std::string(3000, 'A') + "\xc3\x89").c_str()), 0);
}

// Generated names against ICU comparing the whole strings (valid UTF-8), and the order's
// consistency where bytes are not UTF-8.
TEST(CaseCompare, AgreesWithIcuAndStaysATotalOrder) {
    const std::vector<std::string> valid = {"a", "A", "z", "_", "1", "\xc3\xa9", "\xc3\x89", "\xc3\x9f", "ss",
                                            "\xe2\x84\xaa", "k", "\xf0\x9f\x98\x80", "\xef\xbf\xbd"};
    const std::vector<std::string> invalid = {"\xff", "\xfe", "\xc3", "\xe2\x84"};
    std::mt19937 random(7);
    const auto make = [&random](const std::vector<std::string> &pieces, size_t bad,
                                const std::vector<std::string> &extra) {
        std::string out;
        const size_t n = random() % 5;
        for (size_t i = 0; i < n; ++i) {
            out += random() % 8 < bad ? extra[random() % extra.size()] : pieces[random() % pieces.size()];
        }
        return out;
    };
    for (int round = 0; round < 3000; ++round) {
        const std::string a = make(valid, 0, invalid);
        const std::string b = make(valid, 0, invalid);
        const int want = icu::UnicodeString::fromUTF8(a).caseCompare(
            icu::UnicodeString::fromUTF8(b), U_FOLD_CASE_DEFAULT | U_COMPARE_CODE_POINT_ORDER);
        ASSERT_EQ(Sign(VLIBCUnicodeUTF8StrCaseCmp(a.c_str(), b.c_str())), Sign(want)) << a << " / " << b;
    }
    for (int round = 0; round < 3000; ++round) {
        const std::string s[3] = {make(valid, 3, invalid), make(valid, 3, invalid), make(valid, 3, invalid)};
        const auto cmp = [&s](int i, int j) { return Sign(VLIBCUnicodeUTF8StrCaseCmp(s[i].c_str(), s[j].c_str())); };
        ASSERT_EQ(cmp(0, 1), -cmp(1, 0)) << s[0] << " / " << s[1];
        if (cmp(0, 1) <= 0 && cmp(1, 2) <= 0) {
            ASSERT_LE(cmp(0, 2), 0) << s[0] << " / " << s[1] << " / " << s[2];
        }
    }
}

DIRENTRY_INFO Entry(const char *name, bool dir, uint64_t size, int32_t time, uint32_t id, uint32_t mode,
                    const char *type) {
    DIRENTRY_INFO e;
    e.name = name;
    e.isdir = dir;
    e.size = size;
    e.mtime = e.crtime = e.ctime = e.atime = time;
    e.uid = e.gid = id;
    e.mode = mode;
    e.type = type;
    return e;
}

std::string Names(const std::list<DIRENTRY_INFO> &list) {
    std::string out;
    for (const DIRENTRY_INFO &e : list) {
        out += (out.empty() ? "" : " ") + e.name;
    }
    return out;
}

// Reader order; "B" and "b" tie on every key, so they keep this order.
std::list<DIRENTRY_INFO> Sample() {
    return {
        Entry("b", false, 5, 300, 1026, 0100644, "txt"),   Entry("Zed", true, 9, 100, 100, 040755, ""),
        Entry("c.TXT", false, 1, -5, 100, 0100600, "TXT"), Entry("B", false, 5, 300, 1026, 0100644, "txt"),
        Entry("dir", true, 1, 200, 1026, 040700, ""),      Entry("a.bin", false, 7, 300, 1, 0100777, "bin"),
    };
}

TEST(EntrySort, EveryKeyWithTiesDirectoriesFirst) {
    const struct {
        const char *key;
        const char *order;
    } table[] = {
        {"size", "dir Zed c.TXT b B a.bin"},   // folders by name, never by size
        {"mtime", "Zed dir c.TXT a.bin b B"},  // signed: -5 first
        {"crtime", "Zed dir c.TXT a.bin b B"}, {"ctime", "Zed dir c.TXT a.bin b B"},
        {"atime", "Zed dir c.TXT a.bin b B"},  {"user", "Zed dir a.bin c.TXT b B"},  // by uid
        {"group", "Zed dir a.bin c.TXT b B"},  {"posix", "dir Zed c.TXT b B a.bin"},
        {"type", "dir Zed a.bin b B c.TXT"},   // "TXT" ties "txt": then the name
        {"name", "dir Zed a.bin b B c.TXT"},   {"", "dir Zed a.bin b B c.TXT"},
        {"SIZE", "dir Zed a.bin b B c.TXT"},   // keys are exact
    };
    NvoEnum enumeration;
    for (const auto &row : table) {
        std::list<DIRENTRY_INFO> list = Sample();
        enumeration.EntryListSort(list, row.key);
        EXPECT_EQ(Names(list), row.order) << row.key;
    }
    std::list<DIRENTRY_INFO> empty;
    enumeration.EntryListSort(empty, "size");
    EXPECT_TRUE(empty.empty());
    EXPECT_FALSE(EnumCompare("name")(Sample().front(), Sample().front()));  // strict
}

// Generated records (ties on every field, mixed case, non-ASCII and ill-formed names, extreme
// values) sorted by EntryListSort and by the list's own stable sort with EnumCompare: the same
// records in the same order, for every key; each record is told apart by a serial number.
TEST(EntrySort, EqualsTheListSortWithEnumCompare) {
    const std::vector<std::string> pieces = {"a", "A", "b", "B", "z", "Z", "_", "1", ".", "~", "\x7f",
                                             "\xc3\xa9", "\xc3\x89", "\xc3\x9f", "ss", "SS", "\xe2\x84\xaa", "k",
                                             "K", "\xf0\x9f\x98\x80", "\xff", "\xc3"};
    const std::vector<std::string> types = {"", "txt", "TXT", "\xc3\xa9", "bin", "Bin"};
    const char *keys[] = {"size", "mtime", "crtime", "ctime", "atime", "user", "group", "posix", "type", "name",
                          "", "SIZE", "other"};
    std::mt19937 random(11);
    NvoEnum enumeration;
    for (int round = 0; round < 60; ++round) {
        std::list<DIRENTRY_INFO> list;
        const size_t count = random() % 400;
        for (size_t i = 0; i < count; ++i) {
            DIRENTRY_INFO &e = list.emplace_back();
            const size_t length = random() % 4;
            for (size_t p = 0; p < length; ++p) {
                e.name += pieces[random() % pieces.size()];
            }
            if (random() % 16 == 0) {
                e.name += std::string(1, '\0') + "tail";  // compared as a C string up to the NUL
            }
            e.isdir = random() % 3 == 0;
            const uint64_t sizes[] = {0, 1, 2, 0x7FFFFFFFFFFFFFFFull, 0x8000000000000000ull, ~0ull};
            e.size = sizes[random() % 6];
            const int32_t times[] = {0, 1, -1, INT32_MIN, INT32_MAX};
            e.mtime = times[random() % 5];
            e.crtime = times[random() % 5];
            e.ctime = times[random() % 5];
            e.atime = times[random() % 5];
            const uint32_t ids[] = {0, 1, 0x80000000u, 0xFFFFFFFFu};
            e.uid = ids[random() % 4];
            e.gid = ids[random() % 4];
            const uint32_t modes[] = {0100644, 040755, 0100777, 0107644, 0};
            e.mode = modes[random() % 5];
            e.type = types[random() % types.size()];
            e.extra = std::to_string(i);
        }
        for (const char *key : keys) {
            std::list<DIRENTRY_INFO> got = list;
            std::list<DIRENTRY_INFO> want = list;
            enumeration.EntryListSort(got, key);
            want.sort(EnumCompare(key));
            ASSERT_EQ(got.size(), want.size());
            auto w = want.begin();
            for (const DIRENTRY_INFO &g : got) {
                ASSERT_EQ(g.extra, w->extra) << "key " << key << " round " << round;
                ASSERT_EQ(g.name, w->name);
                ++w;
            }
        }
    }
}

TEST(EntrySlice, PagesAtTheEdges) {
    const struct {
        unsigned long offset;
        unsigned long limit;
        const char *kept;
    } table[] = {
        {2, 3, "3 4 5"},          {8, 3, "9 10"},      {10, 3, ""},           {0, 20, "1 2 3 4 5 6 7 8 9 10"},
        {0, 0, "1 2 3 4 5 6 7 8 9 10"},                {7, 0, "1 2 3 4 5 6 7 8 9 10"},
        {0xFFFFFFFFul, 3, ""},    // -1: the cursor walks back onto the end
        {0xFFFFFFFEul, 3, "10"},  {0xFFFFFFFDul, 5, "9 10"},
        {0x100000002ul, 3, "3 4 5"},  // only the low 32 bits count
        {9, 1, "10"},
    };
    NvoEnum enumeration;
    for (const auto &row : table) {
        std::list<DIRENTRY_INFO> list;
        for (int i = 1; i <= 10; ++i) {
            list.emplace_back().name = std::to_string(i);
        }
        enumeration.NvoLibDirEntrySlice(list, row.offset, row.limit);
        EXPECT_EQ(Names(list), row.kept) << row.offset << "+" << row.limit;
    }
    std::list<DIRENTRY_INFO> empty;
    enumeration.NvoLibDirEntrySlice(empty, 0xFFFFFFFFul, 1);
    EXPECT_TRUE(empty.empty());
}

std::string Compact(const Json::Value &value) {
    Json::StreamWriterBuilder writer;
    writer["indentation"] = "";
    return Json::writeString(writer, value);
}

DIRENTRY_INFO Full() {
    DIRENTRY_INFO e;
    e.name = "a.txt";
    e.path = "/public/a.txt";
    e.real_path = "/volume1/public/a.txt";
    e.type = "txt";
    e.size = 5000000000ull;
    e.mode = 0100754;
    e.acl_privilege = 0x20D;  // exec, read, append, delete
    e.is_acl_mode = true;
    e.mtime = 1700000000;
    e.ctime = 1700000001;
    e.crtime = -1;  // shown as an unsigned number
    e.atime = 3;
    e.uid = 1026;
    e.user = "alice";
    e.gid = 100;
    e.group = "users";
    e.mount_point_type = "remote";
    e.freespace = 1ull << 40;
    e.totalspace = 3;
    e.readonly = true;
    return e;
}

// Keys print sorted; numbers written with ".0" are JSON reals.
TEST(DumpFileInfo, EachFlagAddsItsGroup) {
    const std::string base = R"("isdir":false,"name":"a.txt","path":"/public/a.txt")";
    const struct {
        int info;
        const char *additional;  // nullptr: no "additional" at all
    } table[] = {
        {0, nullptr},
        {NVO_INFO_SYNC_SHARE, nullptr},
        {NVO_INFO_REAL_PATH, R"({"real_path":"/volume1/public/a.txt"})"},
        {NVO_INFO_SIZE, R"({"size":5000000000.0})"},
        {NVO_INFO_OWNER, R"({"owner":{"gid":100,"group":"users","uid":1026,"user":"alice"}})"},
        {NVO_INFO_TIME, R"({"time":{"atime":3,"crtime":4294967295,"ctime":1700000001,"mtime":1700000000}})"},
        {NVO_INFO_PERM, R"({"perm":{"acl":{"append":true,"del":true,"exec":true,"read":true,"write":true},)"
                        R"("is_acl_mode":true,"posix":754}})"},
        {NVO_INFO_TYPE, R"({"type":"txt"})"},
        {NVO_INFO_MOUNT_POINT_TYPE, R"({"mount_point_type":"remote"})"},
        {NVO_INFO_VOLUME_STATUS, R"({"volume_status":{"freespace":1099511627776.0,"readonly":true,"totalspace":3.0}})"},
        {NVO_INFO_REAL_PATH | NVO_INFO_TYPE, R"({"real_path":"/volume1/public/a.txt","type":"txt"})"},
    };
    for (const auto &row : table) {
        Json::Value json;
        DumpFileInfo(row.info, Full(), json);
        const std::string want =
            row.additional ? "{\"additional\":" + std::string(row.additional) + "," + base + "}" : "{" + base + "}";
        EXPECT_EQ(Compact(json), want) << row.info;
    }
}

// "write" shows bit 2 (read) on purpose; the real write bit (0x2) shows nowhere.
TEST(DumpFileInfo, ReadAndWriteShareBitTwo) {
    const struct {
        uint32_t mask;
        const char *acl;
    } table[] = {
        {0x4, R"({"append":false,"del":false,"exec":false,"read":true,"write":true})"},
        {0x2, R"({"append":false,"del":false,"exec":false,"read":false,"write":false})"},
        {0x1FFF & ~0x4u, R"({"append":true,"del":true,"exec":true,"read":false,"write":false})"},
    };
    for (const auto &row : table) {
        DIRENTRY_INFO e = Full();
        e.acl_privilege = row.mask;
        Json::Value json;
        DumpFileInfo(NVO_INFO_PERM, e, json);
        EXPECT_EQ(Compact(json["additional"]["perm"]["acl"]), row.acl) << row.mask;
    }
}

TEST(DumpFileInfo, AnExistingPermIsKeptAndOtherValuesBecomeObjects) {
    Json::Value json;
    json["additional"]["perm"]["share"] = 2;
    json["additional"]["owner"]["stale"] = 1;
    DumpFileInfo(NVO_INFO_PERM | NVO_INFO_OWNER, Full(), json);
    EXPECT_EQ(json["additional"]["perm"]["share"], 2);
    EXPECT_EQ(json["additional"]["perm"]["posix"], 754);
    EXPECT_FALSE(json["additional"]["owner"].isMember("stale"));  // created afresh

    Json::Value array(Json::arrayValue);
    array.append(1);
    DumpFileInfo(NVO_INFO_SIZE, DIRENTRY_INFO(), array);
    EXPECT_EQ(Compact(array), R"({"additional":{"size":0.0},"isdir":false,"name":"","path":""})");
    Json::Value text("x");
    DumpFileInfo(0, Full(), text);
    EXPECT_EQ(text["name"], "a.txt");
}

}  // namespace
