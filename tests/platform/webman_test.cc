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

class WebManTest : public ::testing::Test {
protected:
    WebManTest() {
        appliance_.Basic().AddUser("CORP\\dave").AddUser("erin@corp.example");
        unsetenv("HTTP_COOKIE");
        unsetenv("QUERY_STRING");
    }

    std::string LogIn(const char *user) {
        char sid[64];
        return QUIBLoginCreate(user, "secret", "192.0.2.7", sid, sizeof sid) == 0 ? sid : "";
    }

    // The user IsAuthorized accepts for this request, "" when refused.
    std::string Authorize(const char *cookie, const char *query, int mask = 15) {
        cookie != nullptr ? setenv("HTTP_COOKIE", cookie, 1) : unsetenv("HTTP_COOKIE");
        query != nullptr ? setenv("QUERY_STRING", query, 1) : unsetenv("QUERY_STRING");
        WebMan request;
        if (!request.IsAuthorized("test", mask, 1)) {
            EXPECT_EQ(request.GetLoginUserName(), "");
            EXPECT_EQ(request.GetLoginSid(), "");
            return "";
        }
        return request.GetLoginUserName();
    }

    Appliance appliance_;
};

TEST_F(WebManTest, TheCookieCarriesTheSid) {
    const std::string sid = LogIn("alice");
    ASSERT_FALSE(sid.empty());
    const std::string cookies[] = {
        "id=" + sid,
        "lang=en; id=" + sid,
        "id=" + sid + "; lang=en",
        "lang=en;id=" + sid + ";x=1",
        "  id = " + sid + "  ; other",
        "id=\"" + sid + "\"",
        "noequals; id=" + sid,
        "id=" + sid + "; id=stale",  // the first "id" counts, as RFC 6265 orders them
    };
    for (const std::string &cookie : cookies) {
        EXPECT_EQ(Authorize(cookie.c_str(), nullptr), "alice") << cookie;
    }
    setenv("HTTP_COOKIE", ("id=" + sid).c_str(), 1);
    WebMan request;
    EXPECT_EQ(request.GetLoginUserName(), "");
    ASSERT_TRUE(request.IsAuthorized(nullptr, 15, 0));
    EXPECT_EQ(request.GetLoginUserName(), "alice");
    EXPECT_EQ(request.GetLoginSid(), sid);
}

TEST_F(WebManTest, OtherCookiesAreNotTheSid) {
    const std::string sid = LogIn("alice");
    const std::string cookies[] = {
        "xid=" + sid, "id2=" + sid, "ID=" + sid, "_sid=" + sid, "i d=" + sid, "id", "id=", "=" + sid,
        "id=\"" + sid, "id=" + sid + "x", "id=" + sid.substr(1), ";;;;", "",
    };
    for (const std::string &cookie : cookies) {
        EXPECT_EQ(Authorize(cookie.c_str(), nullptr), "") << cookie;
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED) << cookie;
    }
}

// Every byte as %XX, as a client may encode it.
std::string EncodeAll(const std::string &text) {
    static const char kHex[] = "0123456789ABCDEF";
    std::string out;
    for (unsigned char c : text) {
        out += '%';
        out += kHex[c >> 4];
        out += kHex[c & 0xF];
    }
    return out;
}

TEST_F(WebManTest, TheQueryStringCarriesTheSidPercentDecoded) {
    const std::string sid = LogIn("bob");
    const std::string queries[] = {
        "_sid=" + sid,
        "api=x&_sid=" + sid + "&version=1",
        "%5Fsid=" + sid,
        "%5fsid=" + sid,
        "_sid=" + EncodeAll(sid),
        "_sid=%zz&_sid=" + sid,  // a broken escape skips that parameter only
        "&&_sid=" + sid + "&&",
    };
    for (const std::string &query : queries) {
        EXPECT_EQ(Authorize(nullptr, query.c_str()), "bob") << query;
    }
    const std::string refused[] = {
        "sid=" + sid,  "_sid",  "_sid=", "x_sid=" + sid, "_sid=" + sid + "%00", "_sid=" + sid + "+",
        "_sid=%" + sid, "_sid=" + sid.substr(0, 31) + "%2", "_sid+=" + sid,
    };
    for (const std::string &query : refused) {
        EXPECT_EQ(Authorize(nullptr, query.c_str()), "") << query;
    }
}

// A browser may still send an old cookie while the page passes a fresh sid.
TEST_F(WebManTest, AStaleCookieGivesWayToALiveQuerySid) {
    const std::string alice = LogIn("alice");
    const std::string bob = LogIn("bob");
    ASSERT_EQ(QUIBLoginRemove(alice.c_str()), 0);
    EXPECT_EQ(Authorize(("id=" + alice).c_str(), ("_sid=" + bob).c_str()), "bob");
    EXPECT_EQ(Authorize(("id=" + bob).c_str(), ("_sid=" + alice).c_str()), "bob");
    EXPECT_EQ(Authorize("id=garbage'--", ("_sid=" + bob).c_str()), "bob");
}

TEST_F(WebManTest, HostileRequestsAreRefusedWithoutHarm) {
    const std::string sid = LogIn("alice");
    const std::string huge(100000, 'A');
    const std::string hostile[] = {
        "id=" + huge,
        "id=' OR '1'='1",
        "id=" + sid + "' OR '1'='1",
        "id=\xff\xfe\xfd",
        "id=" + std::string(1, '\x01') + sid,
        std::string(20000, ';'),
        "id=\"\"",
        "id=\"",
    };
    for (const std::string &cookie : hostile) {
        EXPECT_EQ(Authorize(cookie.c_str(), nullptr), "") << cookie.substr(0, 40);
    }
    EXPECT_EQ(Authorize(nullptr, ("_sid=" + huge).c_str()), "");
    EXPECT_EQ(Authorize(nullptr, std::string(50000, '&').c_str()), "");
    EXPECT_EQ(Authorize(nullptr, "_sid=%FF%FE"), "");
    EXPECT_EQ(Authorize(nullptr, nullptr), "");
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    // The live login is untouched by all that.
    EXPECT_EQ(Authorize(("id=" + sid).c_str(), nullptr), "alice");
}

TEST_F(WebManTest, TheMaskSelectsKindsOfAccount) {
    const std::string alice = "id=" + LogIn("alice");
    const std::string admin = "id=" + LogIn("admin");
    const std::string dave = "id=" + LogIn("CORP\\dave");
    const std::string erin = "id=" + LogIn("erin@corp.example");
    struct Case {
        const std::string &cookie;
        int mask;
        bool allowed;
    } cases[] = {
        {alice, 0x1, true},  {alice, 0x2, false}, {alice, 0x8, false}, {alice, 0x0, false},
        {admin, 0x8, true},  {admin, 0x1, true},  {admin, 0x6, false}, {dave, 0x2, true},
        {dave, 0x1, false},  {dave, 0x8, false},  {erin, 0x4, true},   {erin, 0x3, false},
        {erin, 15, true},    {dave, 15, true},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(!Authorize(c.cookie.c_str(), nullptr, c.mask).empty(), c.allowed)
            << c.cookie << " mask " << c.mask;
    }
}

}  // namespace
