// The login state of a CGI request: the sid from the cookie "id" or the query parameter
// "_sid", parsed as browsers and clients really send them, and the account-kind mask.
#include <stdlib.h>

#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_login.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;

// Every byte as %XX, as a client may encode it.
std::string EncodeAll(const std::string &text) {
    std::string out;
    for (unsigned char c : text) out += std::string("%") + "0123456789ABCDEF"[c >> 4] + "0123456789ABCDEF"[c & 0xF];
    return out;
}

class WebManTest : public ::testing::Test {
protected:
    WebManTest() { appliance_.Basic().AddUser("CORP\\dave").AddUser("erin@corp.example"); }

    std::string LogIn(const char *user) {
        char sid[64];
        return QUIBLoginCreate(user, "secret", "192.0.2.7", sid, sizeof sid) == 0 ? sid : "";
    }

    // The sid IsAuthorized accepts for this request ("": unset), "" when refused.
    std::string Authorize(const std::string &cookie, const std::string &query, int mask = 15) {
        cookie.empty() ? unsetenv("HTTP_COOKIE") : setenv("HTTP_COOKIE", cookie.c_str(), 1);
        query.empty() ? unsetenv("QUERY_STRING") : setenv("QUERY_STRING", query.c_str(), 1);
        WebMan request;
        if (!request.IsAuthorized("test", mask, 1)) {
            EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
            EXPECT_EQ(request.GetLoginUserName() + request.GetLoginSid(), "");
            return "";
        }
        char user[64] = "";
        EXPECT_EQ(QUIBLoginGet(request.GetLoginSid().c_str(), user, sizeof user), 0);
        EXPECT_EQ(request.GetLoginUserName(), user);
        return request.GetLoginSid();
    }

    Appliance appliance_;
};

TEST_F(WebManTest, TheSidComesFromTheIdCookieOrElseTheSidParameter) {
    const std::string alice = LogIn("alice"), bob = LogIn("bob"), stale = LogIn("admin");
    ASSERT_EQ(QUIBLoginRemove(stale.c_str()), 0);
    const std::string huge(100000, 'A');
    struct Case { std::string cookie, query, sid; } cases[] = {
        {"id=" + alice, "", alice}, {"lang=en; id=" + alice, "", alice}, {"id=" + alice + "; lang=en", "", alice},
        {"lang=en;id=" + alice + ";x=1", "", alice}, {"  id = " + alice + "  ; other", "", alice},
        {"id=\"" + alice + "\"", "", alice}, {"noequals; id=" + alice, "", alice},
        {"id=" + alice + "; id=" + bob, "", alice},  // the first "id" counts, as RFC 6265 orders them
        {"xid=" + alice, "", ""}, {"id2=" + alice, "", ""}, {"ID=" + alice, "", ""}, {"_sid=" + alice, "", ""},
        {"i d=" + alice, "", ""}, {"id", "", ""}, {"id=", "", ""}, {"=" + alice, "", ""}, {"id=\"" + alice, "", ""},
        {"id=" + alice + "x", "", ""}, {"id=" + alice.substr(1), "", ""}, {";;;;", "", ""}, {"", "", ""},
        {"id=" + huge, "", ""}, {"id=" + alice + "' OR '1'='1", "", ""}, {"id=\x01" + alice, "", ""},
        {"", "_sid=" + bob, bob}, {"", "api=x&_sid=" + bob + "&version=1", bob}, {"", "%5Fsid=" + bob, bob},
        {"", "%5fsid=" + bob, bob}, {"", "_sid=" + EncodeAll(bob), bob}, {"", "&&_sid=" + bob + "&&", bob},
        {"", "_sid=%zz&_sid=" + bob, bob},  // a broken escape skips that parameter only
        {"", "_sid=" + bob + "%00", ""},    // so does an escaped NUL, which would cut the sid short
        {"", "sid=" + bob, ""}, {"", "_sid", ""}, {"", "_sid=", ""}, {"", "x_sid=" + bob, ""},
        {"", "_sid=" + bob + "+", ""}, {"", "_sid=%" + bob, ""}, {"", "_sid=" + bob.substr(0, 31) + "%2", ""},
        {"", "_sid+=" + bob, ""}, {"", "_sid=" + huge, ""},
        // A browser may still send a stale cookie while the page passes a live sid.
        {"id=" + stale, "_sid=" + bob, bob}, {"id=garbage'--", "_sid=" + bob, bob}, {"id=" + bob, "_sid=" + stale, bob},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(Authorize(c.cookie, c.query), c.sid) << c.cookie.substr(0, 60) << " | " << c.query.substr(0, 60);
    }
    EXPECT_EQ(Authorize("id=" + alice, ""), alice) << "the live login is untouched by all that";

    WebMan request;
    EXPECT_EQ(request.GetLoginUserName() + request.GetLoginSid(), "");
    setenv("HTTP_COOKIE", ("id=" + alice).c_str(), 1);
    ASSERT_TRUE(request.IsAuthorized(nullptr, 15, 0));
    unsetenv("HTTP_COOKIE");
    EXPECT_FALSE(request.IsAuthorized(nullptr, 15, 0));
    EXPECT_EQ(request.GetLoginUserName() + " " + request.GetLoginSid(), "alice " + alice) << "a refusal keeps them";
}

TEST_F(WebManTest, TheMaskSelectsKindsOfAccount) {
    const std::string alice = "id=" + LogIn("alice"), admin = "id=" + LogIn("admin");
    const std::string dave = "id=" + LogIn("CORP\\dave"), erin = "id=" + LogIn("erin@corp.example");
    struct Case { const std::string &cookie; int mask; bool allowed; } cases[] = {
        {alice, 0x1, true}, {alice, 0x2, false}, {alice, 0x8, false}, {alice, 0x0, false}, {admin, 0x8, true},
        {admin, 0x1, true}, {admin, 0x6, false}, {dave, 0x2, true}, {dave, 0x1, false}, {dave, 0x8, false},
        {erin, 0x4, true}, {erin, 0x3, false}, {erin, 15, true}, {dave, 15, true},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(!Authorize(c.cookie, "", c.mask).empty(), c.allowed) << c.cookie << " mask " << c.mask;
    }
}

}  // namespace
