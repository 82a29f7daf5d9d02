// The CGI request as the web server hands it over (environment and body on a pipe), the
// response header with its cookies, the CGI record's cookie lookup and the session timeout.
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <unistd.h>

#include <map>
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_cgi.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::Failed;
using norvo::testing::Outcome;

struct Request {
    std::string method = "GET", query, type, length, body, cookie;
};

void Set(const char *name, const std::string &value) {
    value.empty() ? unsetenv(name) : setenv(name, value.c_str(), 1);
}

void Enter(const Request &r) {
    Set("REQUEST_METHOD", r.method);
    Set("QUERY_STRING", r.query);
    Set("CONTENT_TYPE", r.type);
    Set("CONTENT_LENGTH", r.length);
    Set("HTTP_COOKIE", r.cookie);
}

// The body as the server hands it over: a descriptor that ends after text.
int BodyPipe(const std::string &text) {
    const int fd = memfd_create("body", MFD_CLOEXEC);
    EXPECT_EQ(write(fd, text.data(), text.size()), static_cast<ssize_t>(text.size()));
    lseek(fd, 0, SEEK_SET);
    return fd;
}

std::string ReadAllOf(int fd) {
    std::string out;
    char buf[4096];
    for (ssize_t got; (got = read(fd, buf, sizeof buf)) > 0;) out.append(buf, static_cast<size_t>(got));
    return out;
}

const char *kForm = "application/x-www-form-urlencoded";

class WebCgiTest : public ::testing::Test {
protected:
    Appliance appliance_;
};

TEST_F(WebCgiTest, ParametersComeFromTheQueryThenTheBody) {
    const std::string big(QUIB_CGI_MAX_BODY, 'x');
    // "-" marks a parameter the request must not have.
    struct Case { Request request; Outcome outcome; std::map<std::string, std::string> in; } cases[] = {
        {{.query = "a=1&b=x%20y+z&a=2&&c&d="}, {0}, {{"a", "1"}, {"b", "x y z"}, {"c", ""}, {"d", ""}, {"e", "-"}}},
        {{.query = "t=%0A%0d%FF%25"}, {0}, {{"t", "\n\r\xff%"}}},
        {{.query = "a=1&t=x%00y"}, Failed(QUIB_ERR_BAD_PARAMETER), {{"a", "-"}}},  // broken escapes: the fuzzer
        {{.method = "POST", .query = "a=q", .type = kForm, .length = "11", .body = "a=b&id=%41x"}, {0},
         {{"a", "q"}, {"id", "Ax"}}},
        {{.method = "POST", .type = "Application/X-WWW-Form-Urlencoded; charset=UTF-8", .length = "3", .body = "a=1&b=2"},
         {0}, {{"a", "1"}, {"b", "-"}}},
        {{.method = "POST", .type = kForm, .length = "10", .body = "a=1"}, Failed(QUIB_ERR_BAD_PARAMETER), {{"a", "-"}}},
        {{.method = "POST", .type = kForm, .length = "3a", .body = "a=1"}, Failed(QUIB_ERR_BAD_PARAMETER), {}},
        {{.method = "POST", .type = kForm, .length = "3", .body = "a%0"}, Failed(QUIB_ERR_BAD_PARAMETER), {}},
        {{.method = "POST", .type = kForm, .length = "5", .body = std::string("a=x\0y", 5)}, Failed(QUIB_ERR_BAD_PARAMETER), {}},
        {{.method = "POST", .type = kForm, .length = std::to_string(big.size() + 1), .body = big + "x"},
         Failed(QUIB_ERR_NAME_TOO_LONG), {}},
        {{.method = "POST", .type = kForm, .length = "99999999999999999999999", .body = ""},
         Failed(QUIB_ERR_NAME_TOO_LONG), {}},
        {{.method = "POST", .type = kForm, .length = std::to_string(big.size()), .body = big}, {0}, {{big, ""}}},
        // Other bodies are the program's to read.
        {{.method = "POST", .query = "a=1", .type = "multipart/form-data; boundary=x", .length = "5", .body = "b=2&c"},
         {0}, {{"a", "1"}, {"b", "-"}}},
        {{.method = "GET", .query = "a=1", .type = kForm, .length = "3", .body = "b=2"}, {0}, {{"a", "1"}, {"b", "-"}}},
    };
    for (const Case &c : cases) {
        Enter(c.request);
        const int body = BodyPipe(c.request.body);
        QUIB::WebCGI cgi;
        EXPECT_EQ(OUTCOME(cgi.Init(body, 1)), c.outcome) << c.request.query << c.request.body.substr(0, 40);
        for (const auto &[name, value] : c.in) {
            const char *got = cgi.In(name.c_str());
            EXPECT_EQ(got != nullptr ? got : "-", value) << c.request.query << " " << name.substr(0, 40);
        }
        if (c.request.method == "POST" && c.request.type.find("multipart") != std::string::npos) {
            EXPECT_EQ(ReadAllOf(body), c.request.body) << "left unread";
        }
        close(body);
    }
}

TEST_F(WebCgiTest, OnlyTokenCookiesAreHandedOut) {
    struct Case { std::string header, name; const char *value; int code; } cases[] = {
        {"lang=en; id=abc.DEF-1_2", "id", "abc.DEF-1_2", 0},
        {" id = \"q9\" ;x=1", "id", "q9", 0},
        {"x=1", "id", nullptr, QUIB_ERR_OPEN_FAILED},
        {"id=a b", "id", nullptr, QUIB_ERR_BAD_PARAMETER},
        {"id=a,b; id=good", "id", nullptr, QUIB_ERR_BAD_PARAMETER},  // the first decides
        {"id=a\x01z", "id", nullptr, QUIB_ERR_BAD_PARAMETER},
        {"id=\xc3\xa9", "id", nullptr, QUIB_ERR_BAD_PARAMETER},
        {"id=", "id", nullptr, QUIB_ERR_BAD_PARAMETER},
        {"id=a%0Ab", "id", "a%0Ab", 0},  // cookies are not percent-decoded
        {"i d=x; id=y", "i d", nullptr, QUIB_ERR_OPEN_FAILED},
        {"s@=x; sid=y", "sid", "y", 0},
    };
    for (const Case &c : cases) {
        Enter({.cookie = c.header});
        QUIB::WebCGI cgi;
        ASSERT_EQ(cgi.Init(0, 1), 0);
        const char *got = cgi.GetCookie(c.name.c_str());
        EXPECT_STREQ(got, c.value) << c.header;

        QuibCgi *record = QuibCgiAlloc("/tmp/x.users", "/tmp/x.users.lock");
        ASSERT_NE(record, nullptr);
        char buf[16] = "";
        EXPECT_EQ(OUTCOME(QuibCgiGetInCookies(record, c.name.c_str(), buf, sizeof buf)),
                  (Outcome{c.code == 0 ? 0 : -1, c.code})) << c.header;
        EXPECT_STREQ(c.code == 0 ? buf : nullptr, c.value);
        const int tight = c.value != nullptr ? static_cast<int>(strlen(c.value)) : 1;
        EXPECT_EQ(OUTCOME(QuibCgiGetInCookies(record, c.name.c_str(), buf, tight)),
                  Failed(c.code == 0 ? QUIB_ERR_NAME_TOO_LONG : c.code)) << "never truncated";
        EXPECT_STREQ(record->szRecordFile, "/tmp/x.users");
        QuibCgiFree(record);
    }
}

TEST_F(WebCgiTest, TheHeaderIsWrittenOnceWithTheQueuedCookies) {
    for (const bool https : {false, true}) {
        Enter({});
        Set("HTTPS", https ? "on" : "");
        int out[2];
        ASSERT_EQ(pipe(out), 0);
        QUIB::WebCGI cgi;
        EXPECT_EQ(cgi.AddCookieToHeader("/", "sharing", "v"), -1) << "not before Init";
        EXPECT_EQ(OUTCOME(cgi.WriteHeader()), Failed(QUIB_ERR_BAD_PARAMETER));
        EXPECT_EQ(cgi.In("a"), nullptr) << "not before Init";
        ASSERT_EQ(cgi.Init(0, out[1]), 0);
        EXPECT_EQ(cgi.AddCookieToHeader("/", "sharing", "Ab.9/x"), -1) << "'/' is no token";
        for (const char *bad : {"a\r\nSet-Cookie: x=1", "a;b", "a b", "", "\"q\""}) {
            EXPECT_EQ(OUTCOME(cgi.AddCookieToHeader("/", "sharing", bad)), Failed(QUIB_ERR_BAD_PARAMETER)) << bad;
            EXPECT_EQ(OUTCOME(cgi.AddCookieToHeader("/", bad, "v")), Failed(QUIB_ERR_BAD_PARAMETER)) << bad;
        }
        for (const char *path : {"", "x", "/a;b", "/a\r\nX: y", static_cast<const char *>(nullptr)}) {
            EXPECT_EQ(OUTCOME(cgi.AddCookieToHeader(path, "sharing", "v")), Failed(QUIB_ERR_BAD_PARAMETER));
        }
        ASSERT_EQ(cgi.AddCookieToHeader("/", "sharing", "Ab.9x"), 0);
        ASSERT_EQ(cgi.AddCookieToHeader("/share", "lang", "en"), 0);
        EXPECT_EQ(OUTCOME(cgi.WriteHeader("text/html\r\nX: y")), Failed(QUIB_ERR_BAD_PARAMETER));
        ASSERT_EQ(cgi.WriteHeader(), 0);
        EXPECT_EQ(cgi.WriteHeader("text/html"), 0);
        EXPECT_EQ(OUTCOME(cgi.AddCookieToHeader("/", "late", "1")), Failed(QUIB_ERR_BAD_PARAMETER));
        close(out[1]);
        const std::string secure = https ? "; Secure" : "";
        EXPECT_EQ(ReadAllOf(out[0]), "Content-Type: application/json; charset=utf-8\r\n"
                                     "Set-Cookie: sharing=Ab.9x; Path=/; HttpOnly; SameSite=Lax" + secure + "\r\n"
                                     "Set-Cookie: lang=en; Path=/share; HttpOnly; SameSite=Lax" + secure + "\r\n\r\n");
        close(out[0]);
    }
    QUIB::WebCGI cgi;  // a header that can't be written counts as written
    ASSERT_EQ(cgi.Init(0, 1000), 0);
    EXPECT_EQ(OUTCOME(cgi.WriteHeader()), Failed(QUIB_ERR_FAILED));
    EXPECT_EQ(cgi.WriteHeader(), 0);
}

TEST_F(WebCgiTest, TheSessionTimeoutIsASettingInMinutes) {
    EXPECT_EQ(OUTCOME(VLIBCConfGetOBXTimeout()), Failed(QUIB_ERR_OPEN_FAILED)) << "no settings file";
    struct Case { const char *value; Outcome outcome; } cases[] = {
        {"30", {30}}, {"1", {1}}, {"525600", {525600}}, {"0", Failed(QUIB_ERR_BAD_PARAMETER)},
        {"525601", Failed(QUIB_ERR_BAD_PARAMETER)}, {"-5", Failed(QUIB_ERR_BAD_PARAMETER)},
        {"15m", Failed(QUIB_ERR_BAD_PARAMETER)}, {"99999999999999999999", Failed(QUIB_ERR_BAD_PARAMETER)},
        {"", Failed(QUIB_ERR_BAD_PARAMETER)},
    };
    for (const Case &c : cases) {
        appliance_.SetSetting("obx_timeout_minutes", c.value);
        EXPECT_EQ(OUTCOME(VLIBCConfGetOBXTimeout()), c.outcome) << c.value;
    }
}

}  // namespace
