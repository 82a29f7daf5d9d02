// A sharing link's folder from the link database, within its validity dates, and its landing
// page byte for byte, with everything that reaches the page escaped. The clock is the test's.
#include <fcntl.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sqlite3.h>

#include "../platform/platform_test_util.h"
#include "appliance.h"
#include "norvo/norvologin.h"
#include "quib_strings.h"

// 0: the real clock. libnorvo's time() is this one (exported from the test).
static long long g_now;
extern "C" __attribute__((visibility("default"))) time_t time(time_t *out) {
    struct timespec ts;
    clock_gettime(CLOCK_REALTIME, &ts);
    const time_t now = g_now != 0 ? static_cast<time_t>(g_now) : ts.tv_sec;
    if (out != nullptr) {
        *out = now;
    }
    return now;
}

namespace {

using norvo::testing::Appliance;
using NorvoLogin::FolderSharingLoginManager;

const char kDb[] = "/usr/quib/etc/filebrowser/fbsharing.db";
const char kSummary[] = "norvologin:# Sharing download DBquery failed";
const char kOut[] = "norvologin:# sharing link out of valid duration";

struct Cgi {
    QUIB::WebCGI cgi;
    explicit Cgi(const std::string &query) {
        setenv("REQUEST_METHOD", "GET", 1);
        setenv("QUERY_STRING", query.c_str(), 1);
        EXPECT_EQ(cgi.Init(-1, 1), 0);
    }
};

std::string Encoded(const std::string &text) {
    std::string out;
    for (unsigned char c : text) {
        char hex[4];
        snprintf(hex, sizeof hex, "%%%02X", c);
        out += isalnum(c) ? std::string(1, static_cast<char>(c)) : hex;
    }
    return out;
}

std::string FolderOf(const std::string &query) {
    Cgi c(query);
    return FolderSharingLoginManager().GetSharingFolderPath(c.cgi);
}

void Sql(const std::string &sql) {
    sqlite3 *db = nullptr;
    ASSERT_EQ(sqlite3_open(kDb, &db), SQLITE_OK);
    EXPECT_EQ(sqlite3_exec(db, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK) << sql;
    sqlite3_close(db);
}

class SharingLink : public ::testing::Test {
protected:
    void SetUp() override {
        unsetenv("HTTP_FOLDER_SHARING");
        unsetenv("HTTP_ACCEPT_LANGUAGE");
        app_.Basic();
    }
    void TearDown() override { g_now = 0; }
    Appliance app_;
};

TEST_F(SharingLink, ValidityDates) {
    constexpr long long kNow = 1700000500;
    const struct {
        const char *avail, *exp;
        long long now;
        bool valid;
    } rows[] = {
        {"1800000000", "0", kNow, true},             // never expires, the start not even looked at
        {"1800000000", "86399", kNow, true},          // adjusted to 0: never expires
        {"0", "1700000000", 1700086399, true},        // ends in 0: valid through that day
        {"0", "1700000000", 1700086400, false},
        {"0", "1700000001", 1700000001, true},        // any other: an exact moment
        {"0", "1700000001", 1700000002, false},
        {"1700000500", "1700100000", 1700000500, true},  // valid from the exact second
        {"1700000501", "1700100000", 1700000500, false},
        {"0", "9223372036854775807", kNow, true},     // the 64-bit limits, exact
        {"0", "9223372036854775800", kNow, true},
        {"0", "99999999999999999999", kNow, true},    // saturates as strtoll does
        {"0", "-9223372036854775808", kNow, false},
        {"-9223372036854775808", "1800000000", kNow, true},
        {"9223372036854775807", "1800000000", kNow, false},
        {"0", "-86399", kNow, false},                 // negative dates adjust as C remainders do
        {"0", "soon", kNow, true},                    // no number: 0, never expires
    };
    std::vector<std::string> expected;
    for (const auto &row : rows) {
        SCOPED_TRACE(std::string(row.avail) + " " + row.exp + " at " + std::to_string(row.now));
        app_.AddSharingLink({.id = "L", .owner = "alice", .path = "/photo/2024", .availDate = row.avail, .expDate = row.exp});
        g_now = row.now;
        EXPECT_EQ(FolderOf("FOLDER_SHARING=L"), row.valid ? "/photo/2024" : "");
        if (!row.valid) {
            expected.push_back(kOut);
        }
    }
    EXPECT_EQ(app_.ErrorLines(), expected);
}

TEST_F(SharingLink, BrokenRowsAndDatabases) {
    const std::string query = "SELECT * FROM sharingLinks WHERE linkID = 'L' LIMIT 1;";
    const struct {
        const char *setup;  // SQL run on the database, or a file's text after "file:", or "link:"
        const char *query;
        const char *folder;
        std::vector<std::string> lines;
    } rows[] = {
        {"", "FOLDER_SHARING=L", "/public", {}},
        {"", "FOLDER_SHARING=M", "", {"norvologin:# faild to fetch query result", kSummary}},
        {"", "FOLDER_SHARING=L%27%20OR%20%271%27%3D%271", "", {"norvologin:# faild to fetch query result", kSummary}},
        {"", "", "", {"norvologin:# faild to fetch query result", kSummary}},  // no id: NULL matches nothing
        {"UPDATE sharingLinks SET uid = NULL", "FOLDER_SHARING=L", "", {"norvologin:# faild to fetch uid", kSummary}},
        {"UPDATE sharingLinks SET AvailDate = NULL", "FOLDER_SHARING=L", "", {"norvologin:# faild to fetch AvailDate", kSummary}},
        {"UPDATE sharingLinks SET ExpDate = NULL", "FOLDER_SHARING=L", "", {"norvologin:# ExpDate", kSummary}},
        {"UPDATE sharingLinks SET filepath = NULL", "FOLDER_SHARING=L", "", {}},
        {"DROP TABLE sharingLinks", "FOLDER_SHARING=L", "",
         {"norvologin:# Failed to exec [" + query + "] (no such table: sharingLinks)", kSummary}},
        {"file:SQLite format 3 and then nothing", "FOLDER_SHARING=L", "",
         {"norvologin:# Failed to exec [" + query + "] (file is not a database)", kSummary}},
        {"file:", "FOLDER_SHARING=L", "",  // an empty file is an empty database
         {"norvologin:# Failed to exec [" + query + "] (no such table: sharingLinks)", kSummary}},
        {"link:", "FOLDER_SHARING=L", "", {"norvologin:# Failed to connect to database", kSummary}},
    };
    for (const auto &row : rows) {
        SCOPED_TRACE(std::string(row.setup) + " / " + row.query);
        ASSERT_EQ(system("rm -rf /usr/quib/etc/filebrowser /usr/quib/etc/elsewhere"), 0);
        app_.AddSharingLink({.id = "L", .owner = "bob", .path = "/public"});
        const std::string setup = row.setup;
        if (setup.rfind("file:", 0) == 0) {
            app_.WriteFile(kDb, setup.substr(5));
        } else if (setup == "link:") {
            ASSERT_EQ(rename("/usr/quib/etc/filebrowser", "/usr/quib/etc/elsewhere"), 0);
            ASSERT_EQ(symlink("elsewhere", "/usr/quib/etc/filebrowser"), 0);
        } else if (!setup.empty()) {
            Sql(setup);
        }
        app_.ClearLogs();
        EXPECT_EQ(FolderOf(row.query), row.folder);
        EXPECT_EQ(app_.ErrorLines(), row.lines);
    }
    ASSERT_EQ(unlink("/usr/quib/etc/filebrowser"), 0);
    EXPECT_EQ(FolderOf("FOLDER_SHARING=L"), "");  // no database at all
    app_.AddSharingLink({.id = "H", .owner = "bob", .path = "/photo"});
    setenv("HTTP_FOLDER_SHARING", "H", 1);  // the header names the link before the parameter
    EXPECT_EQ(FolderOf("FOLDER_SHARING=L"), "/photo");
}

// The page as the rows write it, for the values that reach it.
std::string Page(const std::string &T, const std::string &S, const std::string &title, const std::string &lang,
                 const std::string &md5, const std::string &path) {
    const std::string V = "1600000000";
    return "Content-Type: text/html; charset=\"UTF-8\"\r\n\r\n"
           "    <!DOCTYPE html>    <html>\n"
           "    <head>\n"
           "    \t<meta http-equiv='Content-Type' content='text/html; charset=utf-8'>\n"
           "        <meta http-equiv='X-UA-Compatible' content='IE=9' />\n"
           "\t\t<title>" + title + "</title>\n"
           "\t\t<script type='text/javascript' src='" + T + "/webman/quibdefs.cgi?v=" + V + "'></script>\n"
           "\t\t<script type='text/javascript' src='" + T + "/scripts/uistrings.cgi?lang=" + lang + "&" + V + "'></script>\n"
           "\t\t<script type='text/javascript' src='" + T + "/norvo/webUI/uistrings.cgi?lang=" + lang + "&" + V + "'></script>\n"
           "\t\t<script type='text/javascript' src='" + T + "/webman/uistrings.cgi?lang=" + lang + "&" + V + "'></script>\n"
           "    \t<script type='text/javascript'>var g_Lang = '" + lang + "';</script>\n"
           "    \t<script type='text/javascript'>var g_Tunnel = '" + T + "';</script>\n"
           "    \t<script type='text/javascript'>var g_Version = '" + V + "';</script>\n"
           "    \t<script type='text/javascript'>var g_MD5 = '" + md5 + "';</script>\n"
           "    \t<script type='text/javascript'>var g_FolderPath = '" + path + "';</script>\n"
           "    </head>\n"
           "<meta http-equiv='Content-Type' content='text/html; charset=utf-8'>\n"
           "<link rel='stylesheet' type='text/css' href='" + T + "/scripts/ext-3/resources/css/ext-all.css?v=" + V + S + "' />\n"
           "<link rel='stylesheet' type='text/css' href='" + T + "/scripts/ext-3/resources/css/xtheme-gray-quib.css?v=" + V + S + "' />\n"
           "<link rel='stylesheet' type='text/css' href='" + T + "/webman/resources/css/desktop.css?v=" + V + S + "' />\n"
           "<link rel='stylesheet' type='text/css' href='" + T + "/webman/resources/css/flexcrollstyles.css?v=" + V + S + "' />\n"
           "<link rel='stylesheet' type='text/css' href='" + T + "/webman/modules/FileBrowser/style.css?v=" + V + S + "' />\n"
           "<link rel='stylesheet' type='text/css' href='" + T + "/webman/modules/FileBrowser/norvo/folderSharing/style.css?v=" + V + S + "' />\n"
           "<script type='text/javascript' src='" + T + "/scripts/ext-3/adapter/ext/ext-base.js?" + V + S + "'></script>\n"
           "<script type='text/javascript' src='" + T + "/scripts/ext-3/ext-all.js?" + V + S + "'></script>\n"
           "<script type='text/javascript' src='" + T + "/scripts/ext-3/ux/ux-all.js?" + V + S + "'></script>\n"
           "<script type='text/javascript' src='" + T + "/scripts/scrollbar/flexcroll.js?v=" + V + S + "'></script>\n"
           "<script type='text/javascript' src='" + T + "/webman/modules/FileBrowser/FolderSharingLoader.js?" + V + S + "'></script>\n"
           "<body>\n"
           "</body></html>\n";
}

class LandingPage : public SharingLink {
protected:
    void SetUp() override {
        SharingLink::SetUp();
        for (const char *lang : {"de", "fr", "zh-tw", "Xx"}) {
            app_.MakeDir(std::string("/usr/quib/quibman/webman/texts/") + lang + "/filemanager");
        }
        app_.WriteFile("/usr/quib/quibman/webman/texts/de/filemanager/filetable", "title=\"Ordner\"\n");
        const struct timespec times[2] = {{1600000000, 0}, {1600000000, 0}};
        ASSERT_EQ(utimensat(AT_FDCWD, "/usr/quib/quibman/webman", times, 0), 0);
    }
    // What WriteWebPage writes to standard output for the request query.
    static std::string Written(const std::string &query, const std::string &md5, const std::string &folder) {
        fflush(stdout);
        const int saved = dup(1);
        const int fd = open("/tmp/page", O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
        dup2(fd, 1);
        {
            Cgi c(query);
            FolderSharingLoginManager().WriteWebPage(c.cgi, md5, folder);
        }
        fflush(stdout);
        dup2(saved, 1);
        close(saved);
        close(fd);
        return norvo::testing::ReadFile("/tmp/page");
    }
};

TEST_F(LandingPage, AnOrdinaryFolderByteForByte) {
    g_now = 1700000000;
    srand(1700000000);
    const std::string buster = std::to_string(rand() % 1000 + 1);
    EXPECT_EQ(Written("", "0a1B", "/photo/2013"), Page("", "", "2013", "en", "0a1B", "/photo/2013"));
    EXPECT_EQ(Written("noCache=&tunnel=", "", "/photo/2013"), Page("", "", "2013", "en", "", "/photo/2013"));
    EXPECT_EQ(Written("noCache=1&tunnel=/t", "", "/photo/2013"), Page("/t", buster, "2013", "en", "", "/photo/2013"));
    EXPECT_TRUE(app_.ErrorLines().empty());
}

// Each value lands escaped for its place, or is left out; ordinary ones stay as they are.
TEST_F(LandingPage, WhatReachesThePage) {
    const std::string longName(300, 'n');
    const struct {
        std::string folder, title, path;
    } folders[] = {
        {"/photo/2013/", "/photo/2013/", "/photo/2013/"},
        {"", "", ""},
        {"album", "album", "album"},
        {"/p/" + longName, std::string(254, 'n'), "/p/" + longName},
        {"/p/a'b\\c\"d", "a&#39;b\\c&quot;d", "/p/a\\'b\\\\c\\\"d"},
        {"/p/<b>&amp;", "&lt;b&gt;&amp;amp;", "/p/\\x3Cb>&amp;"},
        {"/p/</script><script>alert(1)</script>", "script&gt;", "/p/\\x3C/script>\\x3Cscript>alert(1)\\x3C/script>"},
        {"/p/a\nb\rc\xE2\x80\xA8" "d\xE2\x80\xA9", "a\nb\rc\xE2\x80\xA8" "d\xE2\x80\xA9", "/p/a\\nb\\rc\\u2028d\\u2029"},
    };
    for (const auto &f : folders) {
        SCOPED_TRACE(f.folder);
        EXPECT_EQ(Written("", "", f.folder), Page("", "", f.title, "en", "", f.path));
    }
    const struct {
        const char *tunnel, *md5, *T, *M;
    } values[] = {
        {"/t/x-1_2.~", "deadBEEF09", "/t/x-1_2.~", "deadBEEF09"},
        {"//evil.example", "x", "", ""},
        {"https://evil.example", "0a';alert(1);'", "", ""},
        {"/a//b", "0x1", "", ""},
        {"/a\\b", "1 2", "", ""},
        {"/a'b", "", "", ""},
        {"javascript:alert(1)", "", "", ""},
        {"t", "", "", ""},
    };
    for (const auto &v : values) {
        SCOPED_TRACE(v.tunnel);
        EXPECT_EQ(Written("tunnel=" + Encoded(v.tunnel), v.md5, "/photo"), Page(v.T, "", "photo", "en", v.M, "/photo"));
    }
}

TEST_F(LandingPage, LanguageOfTheRequest) {
    const struct {
        const char *header, *lang;
    } rows[] = {  // the rules themselves are the fuzzer's (accept_language_fuzz): here the wiring
        {"fr;q=0.5, de-CH;q=0.9", "de"},
        {"zh", "zh-tw"},
        {"xx", "en"},  // "Xx" is not named as a lower-case tag: no language
        {"", "en"},
    };
    for (const auto &row : rows) {
        SCOPED_TRACE(row.header);
        setenv("HTTP_ACCEPT_LANGUAGE", row.header, 1);
        EXPECT_STREQ(QuibCgiSelectDefLang(), row.lang);
    }
    setenv("HTTP_ACCEPT_LANGUAGE", "de", 1);
    const StringBundle de(QUIB_STRINGS_FILE_MANAGER, "filetable");
    EXPECT_STREQ(de.Get("title"), "Ordner");
    const StringBundle fallback(QUIB_STRINGS_FILE_MANAGER, "filetable", "fr");  // no table: "en" has none either
    EXPECT_FALSE(fallback.IsOpen());
    EXPECT_FALSE(StringBundle(QUIB_STRINGS_FILE_MANAGER, "../../etc").IsOpen());
}

}  // namespace
