// A sharing-link visitor through the real web front: lighttpd runs norvo.cgi, curl asks.
// Each login takes its second here: the CGI program sleeps for real.
#include <unistd.h>

#include <fstream>
#include <regex>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "web_front.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::WebFront;

const std::string kFile = "/tmp/foldersharing.current.users";

std::string Read(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

// The session id the reply's cookie L1 carries ("" when none).
std::string CookieOf(const WebFront::Reply &reply) {
    std::smatch m;
    return std::regex_search(reply.head, m, std::regex("Set-Cookie: L1=([^;]+); Path=/; HttpOnly")) ? m[1].str() : "";
}

const char kDenied[] = R"({"error":{"code":407,"key":"error:error_privilege_not_enough"},"success":false})"
                       "\n";

class SharingWeb : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic().SetAppPrivilege("QUIB.TVQ.App.Tovana3.Instance", "@users").SetSetting("auto_block_attempts", "3");
        app_.WriteFile("/volume1/public/dir/a.txt", "hello", "alice");
        app_.AddSharingLink({.id = "L1", .owner = "alice", .path = "/public/dir"});
    }
    Appliance app_;
};

// End to end only: the session rules themselves (expiry, sweep, skip_checksrcip, the file's mode)
// are the sharing-login tests'.
TEST_F(SharingWeb, AVisitorLogsInAndListsFromItsAddressOnly) {
    WebFront web(NORVO_CGI);
    const WebFront::Reply login = web.Get("api=login&FOLDER_SHARING=L1");
    EXPECT_EQ(login.body, R"({"data":{"user":"alice"},"success":true})" "\n");
    const std::string id = CookieOf(login);
    ASSERT_EQ(id.size(), 13u) << login.head;
    const std::regex line("127\\.0\\.0\\.1,alice," + id + ",([0-9]+),([0-9]+),([12]),0,L1\n");
    std::smatch m;
    const std::string first = Read(kFile);
    ASSERT_TRUE(std::regex_match(first, m, line)) << first;
    EXPECT_EQ(m[3], "1");

    const std::string cookie = "Cookie: L1=" + id;
    const WebFront::Reply list = web.Get("api=list&FOLDER_SHARING=L1", {cookie});
    EXPECT_NE(list.body.find(R"("total":1)"), std::string::npos) << list.body;
    EXPECT_NE(list.body.find(R"("name":"a.txt")"), std::string::npos);
    const std::string refreshed = Read(kFile);
    ASSERT_TRUE(std::regex_match(refreshed, m, line));
    EXPECT_EQ(m[3], "2");
    EXPECT_EQ(web.Get("api=list&FOLDER_SHARING=L1", {cookie}, "127.0.0.2").body, kDenied);
    EXPECT_TRUE(app_.ErrorLines().empty());
}

TEST_F(SharingWeb, FailuresBlockAndHostileRequestsForgeNothing) {
    WebFront web(NORVO_CGI);
    // Guessed link ids count as failed logins; a good login starts the count again.
    web.Get("api=login&FOLDER_SHARING=nope", {}, "127.0.0.2"), web.Get("api=login&FOLDER_SHARING=nope", {}, "127.0.0.2");
    ASSERT_EQ(CookieOf(web.Get("api=login&FOLDER_SHARING=L1", {}, "127.0.0.2")).size(), 13u);
    web.Get("api=login&FOLDER_SHARING=nope", {}, "127.0.0.2"), web.Get("api=login&FOLDER_SHARING=nope", {}, "127.0.0.2");
    EXPECT_EQ(web.Get("api=list&FOLDER_SHARING=L1", {"Cookie: L1=guessed1234567"}, "127.0.0.2").body, kDenied);
    EXPECT_EQ(web.Get("api=login&FOLDER_SHARING=L1", {}, "127.0.0.2").body, kDenied);  // the third: blocked

    // Forwarded addresses are not taken from strangers; a cookie that is no token, a line break
    // in the link id: nothing written.
    const std::string before = Read(kFile);
    EXPECT_EQ(web.Get("api=list&FOLDER_SHARING=L1", {"X-Forwarded-For: 127.0.0.2", "Cookie: L1=\"a b\""}).body,
              kDenied);
    EXPECT_EQ(web.Post("api=login", "FOLDER_SHARING=L1%0A127.0.0.1,admin,X,1,1,1,1,L1").body,
              R"({"error":{"code":400,"key":"error:error_error_system"},"success":false})" "\n");
    EXPECT_EQ(Read(kFile), before);
    {
        WebFront proxied(NORVO_CGI, "127.0.0.1");
        EXPECT_EQ(proxied.Get("api=login&FOLDER_SHARING=L1", {"Client-IP: 10.0.0.1,10.0.0.2"}).body, kDenied);
    }
    EXPECT_EQ(Read(kFile), before);

    // bob's file behind a link at the session file's place.
    app_.WriteFile("/tmp/bob.txt", "bob's\n", "bob", 0644);
    unlink(kFile.c_str());
    ASSERT_EQ(symlink("/tmp/bob.txt", kFile.c_str()), 0);
    EXPECT_EQ(web.Get("api=login&FOLDER_SHARING=L1").body, kDenied);
    EXPECT_EQ(Read("/tmp/bob.txt"), "bob's\n");
    std::vector<std::string> lines;
    for (int guess = 0; guess < 4; ++guess) {  // each guessed id, looked up in the link database
        lines.insert(lines.end(), {"norvologin:# faild to fetch query result", "norvologin:# Sharing download DBquery failed"});
    }
    lines.insert(lines.end(), {"norvologin:# QUIBAutoBlockIsDeniedIP", "norvologin:# Failed to get client ip."});
    EXPECT_EQ(app_.ErrorLines(), lines);
}

// The landing page in a real browser (one launch, every host but 127.0.0.1 unresolvable): a page
// of the server's own loads each link's landing page in a frame of the same origin and reports
// what the document and its scripts hold.
TEST_F(SharingWeb, TheLandingPageInABrowser) {
    if (access("/usr/bin/chromium", X_OK) != 0) {
        GTEST_SKIP() << "chromium is not installed (scripts/deps.sh installs it)";
    }
    app_.AddSharingLink({.id = "Q", .owner = "alice", .path = "/public/it's a \\ and a \""});
    app_.AddSharingLink({.id = "X", .owner = "alice", .path = "/public/x</script><script>alert(1)</script>"});
    WebFront web(NORVO_CGI);
    std::ofstream(web.DocumentRoot() + "/check.html") << R"(<!DOCTYPE html><html><body><pre id="out"></pre><script>
const pages = {plain: 'L1', quoted: 'Q', script: 'X', tunnel: 'L1&tunnel=//evil.example&md5=%27%3Balert(1)%2F%2F'};
const results = {};
let pending = Object.keys(pages).length;
for (const [name, link] of Object.entries(pages)) {
  const frame = document.createElement('iframe');
  frame.src = '/cgi-bin/norvo.cgi?api=page&FOLDER_SHARING=' + link;
  frame.onload = () => {
    const w = frame.contentWindow, d = frame.contentDocument;
    const urls = [...d.querySelectorAll('[src],[href]')].map(e => e.src || e.href);
    results[name] = {title: d.title, path: w.g_FolderPath, tunnel: w.g_Tunnel, md5: w.g_MD5,
                     elements: d.querySelectorAll('*').length, scripts: d.scripts.length,
                     inline: [...d.scripts].filter(s => !s.src).map(s => s.text.split(' = ')[0]).join(','),
                     foreign: urls.filter(u => !u.startsWith(location.origin + '/')).length};
    if (--pending === 0) document.getElementById('out').textContent = JSON.stringify(Object.keys(pages).map(n => results[n]));
  };
  document.body.appendChild(frame);
}
</script></body></html>)";
    const std::string netLog = "/tmp/chromium-net.json";
    const std::string command =
        "/usr/bin/chromium --headless --no-sandbox --disable-gpu --disable-dev-shm-usage --no-first-run "
        "--disable-background-networking --disable-component-update --disable-sync --disable-extensions "
        "--user-data-dir=/tmp/chromium-profile --host-resolver-rules='MAP * ~NOTFOUND, EXCLUDE 127.0.0.1' "
        "--log-net-log=" + netLog + " --virtual-time-budget=10000 --dump-dom "
        "http://127.0.0.1:" + std::to_string(web.port()) + "/check.html 2>/dev/null";
    std::string dom;
    FILE *browser = popen(command.c_str(), "r");
    ASSERT_NE(browser, nullptr);
    char buf[4096];
    for (size_t got; (got = fread(buf, 1, sizeof buf, browser)) > 0;) {
        dom.append(buf, got);
    }
    EXPECT_EQ(pclose(browser), 0);
    // The text of <pre id="out">, as the DOM dump writes it (<, > and & escaped).
    const size_t from = dom.find("<pre id=\"out\">"), to = dom.find("</pre>");
    ASSERT_TRUE(from != std::string::npos && to != std::string::npos) << dom;
    const std::string same = R"("tunnel":"","md5":"","elements":27,"scripts":14,)"
                             R"("inline":"var g_Lang,var g_Tunnel,var g_Version,var g_MD5,var g_FolderPath","foreign":0})";
    EXPECT_EQ(dom.substr(from + 14, to - from - 14),
              R"([{"title":"dir","path":"/public/dir",)" + same +
              R"(,{"title":"it's a \\ and a \"","path":"/public/it's a \\ and a \"",)" + same +
              R"(,{"title":"script&gt;","path":"/public/x&lt;/script&gt;&lt;script&gt;alert(1)&lt;/script&gt;",)" + same +
              R"(,{"title":"dir","path":"/public/dir",)" + same + "]");
    const std::string log = Read(netLog);
    EXPECT_NE(log.find("check.html"), std::string::npos);  // the log is the browser's
    EXPECT_NE(log.find("tunnel=//evil.example"), std::string::npos);  // asked for, in the frame's address
    EXPECT_EQ(log.find("://evil.example"), std::string::npos);        // never loaded from
}

}  // namespace
