// Uploads and downloads through the real web front: lighttpd runs norvo.cgi, curl sends.
#include <dirent.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <regex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "../platform/platform_test_util.h"
#include "appliance.h"
#include "web_front.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::LogLine;
using norvo::testing::WebFront;
using Lines = std::vector<std::string>;

const auto Read = norvo::testing::ReadFile;

// Every file below dir, "@tmp" included: what a refused upload must not have left.
Lines Tree(const std::string &dir) {
    Lines names;
    if (DIR *d = opendir(dir.c_str())) {
        while (const dirent *e = readdir(d)) {
            const std::string name = e->d_name;
            if (name != "." && name != "..") {
                names.push_back(dir + "/" + name);
                for (const std::string &below : Tree(dir + "/" + name)) {
                    names.push_back(below);
                }
            }
        }
        closedir(d);
    }
    std::sort(names.begin(), names.end());
    return names;
}

std::string Form(const std::string &disposition, const std::string &data, const std::string &end = "--B--\r\n") {
    return "--B\r\nContent-Disposition: form-data; " + disposition + "\r\nContent-Type: text/plain\r\n\r\n" + data +
           "\r\n" + end;
}

const char kType[] = "Content-Type: multipart/form-data; boundary=B";

std::string Code(int code) {
    return "\"code\":" + std::to_string(code) + ",";
}

class UploadWeb : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic().SetAppPrivilege("QUIB.TVQ.App.Tovana3.Instance", "@users").SetSetting("filebrowserxferlog", "yes");
        app_.MakeDir("/volume1/public/dir", "alice").MakeDir("/volume3");
        ASSERT_EQ(mount("tmpfs", "/volume3", "tmpfs", 0, "size=1m"), 0);  // a volume soon full
        norvo::testing::ShareSpec small;
        small.name = "small", small.volume = "/volume3", small.readWrite = "@users";
        app_.AddShare(small);
        app_.AddSharingLink({.id = "L1", .owner = "alice", .path = "/public/dir"})
            .AddSharingLink({.id = "L2", .owner = "bob", .path = "/photo"})
            .AddSharingLink({.id = "L3", .owner = "alice", .path = "/small"});
    }
    // The cookie header of a logged-in visitor of link.
    std::string Login(const std::string &link) {
        const WebFront::Reply reply = web_->Get("api=login&FOLDER_SHARING=" + link);
        std::smatch m;
        EXPECT_TRUE(std::regex_search(reply.head, m, std::regex("Set-Cookie: " + link + "=([^;]+);"))) << reply.body;
        return "Cookie: " + link + "=" + m[1].str();
    }
    Lines Records() {
        Lines records;
        for (const LogLine &line : app_.Logs()) {
            if (line.priority == LOG_INFO) {
                records.push_back(line.text);
            }
        }
        return records;
    }
    Appliance app_;
    std::unique_ptr<WebFront> web_;
};

TEST_F(UploadWeb, AFileLandsOwnedByTheUserOrNothingIsWritten) {
    web_ = std::make_unique<WebFront>(NORVO_CGI);
    const std::string alice = Login("L1"), bob = Login("L2"), small = Login("L3");
    std::string data(300000, '\0');
    for (size_t i = 0; i < data.size(); ++i) {
        data[i] = static_cast<char>(i * 7919 >> 5);  
    }
    data.replace(1000, 5, "\r\n--b");  // near the delimiter, not it
    const WebFront::Reply done = web_->PostBody("api=upload&FOLDER_SHARING=L1",
                                                Form("name=\"x\"", "field\r\n-B\r\n", "") +
                                                    Form("name=\"file\"; filename=\"a.txt\"", data),
                                                {alice, kType});
    EXPECT_EQ(done.body, R"({"data":{"path":"/public/dir/a.txt","size":300000},"success":true})" "\n");
    struct stat st;
    ASSERT_EQ(stat("/volume1/public/dir/a.txt", &st), 0);
    EXPECT_EQ(st.st_uid, app_.Uid("alice"));
    EXPECT_EQ(Read("/volume1/public/dir/a.txt"), data);
    EXPECT_EQ(Records(), (Lines{"client=\"127.0.0.1\" user=\"alice\" action=\"upload\" size=300000 type=file "
                                "path=\"/public/dir/a.txt\""}));
    app_.ClearLogs();

    const Lines before = Tree("/volume1");
    const std::string file = Form("name=\"file\"; filename=\"b\"", "bytes");
    struct Row {
        std::string cookie, link, type, body;
        int code;
    } rows[] = {
        {bob, "L2", kType, file, 407},                                                  // read-only share
        {small, "L3", kType, Form("name=\"file\"; filename=\"big\"", data + data + data + data), 416},
        {alice, "L1", "Content-Type: multipart/form-data", file, 1800},                 // no boundary
        {alice, "L1", "Content-Type: multipart/form-data; boundary=\"\"", file, 1800},
        {alice, "L1", kType, file.substr(0, file.size() - 12), 1801},                   // truncated
        {alice, "L1", kType, Form("name=\"file\"; filename=\"a\r\nb\"", "x"), 1800},
        {alice, "L1", kType, Form("name=\"file\"; filename=\"../b\"", "x"), 1800},
        {alice, "L1", kType, Form("name=\"fi\r\nle\"; filename=\"b\"", "x"), 1800},
        {alice, "L1", kType, Form("name=\"file\"; filename=\"b\"; filename=\"c\"", "x"), 1800},
        {alice, "L1", kType, Form("name=\"x\"", "x"), 1800},                            // no file
        {alice, "L1", kType, Form("name=\"file\"; filename=\"c\"", "x", "") + file, 1800},                                        // two files
        {alice, "L1", kType, Form("name=\"file\"; filename=\"._b\"", "x"), 418},        // reserved name
        {bob, "L1", kType, file, 407},                                                  // another link's session
    };
    for (const Row &row : rows) {
        const WebFront::Reply reply =
            web_->PostBody("api=upload&FOLDER_SHARING=" + row.link, row.body, {row.cookie, row.type});
        EXPECT_NE(reply.body.find(Code(row.code)), std::string::npos) << row.body << reply.body;
    }
    EXPECT_EQ(Tree("/volume1"), before);
    EXPECT_EQ(Tree("/volume3"), (Lines{"/volume3/@tmp", "/volume3/@tmp/norvo", "/volume3/small"}));
    EXPECT_EQ(Records(), Lines{});
    EXPECT_EQ(app_.ErrorLines(), (Lines{"norvomisc.cpp:# Share no upload privilege, path=/photo/b",
                                        "norvoupload.cpp:# No upload privilege to path /photo/b",
                                        "norvoupload.cpp:# Invalid path:/volume1/public/dir/._b, reason=[1A2]"}));
}

TEST_F(UploadWeb, ADownloadSendsTheBytesUnderASafeName) {
    std::string data(200000, 'z');
    data[7] = '\0';
    app_.WriteFile("/volume1/public/dir/\xC3\xA9\"q.bin", data, "alice", 0600);
    app_.WriteFile("/volume1/public/secret", "no", "alice", 0600);
    ASSERT_EQ(symlink("../secret", "/volume1/public/dir/link"), 0);
    web_ = std::make_unique<WebFront>(NORVO_CGI);
    const std::string alice = Login("L1");
    const WebFront::Reply got = web_->Get("api=download&FOLDER_SHARING=L1&file=%C3%A9%22q.bin", {alice});
    EXPECT_EQ(got.body, data);
    EXPECT_NE(got.head.find("\r\nContent-Length: 200000\r\n"), std::string::npos) << got.head;
    EXPECT_NE(got.head.find("\r\nContent-Type: application/octet-stream\r\n"), std::string::npos);
    EXPECT_NE(got.head.find("\r\nContent-Disposition: attachment; filename=\"___q.bin\"; "
                            "filename*=UTF-8''%C3%A9%22q.bin\r\n"),
              std::string::npos);
    for (const char *file : {"link", "..%2Fsecret", "%2Fetc%2Fpasswd", "nope", "dir%2F.", ""}) {
        const WebFront::Reply refused = web_->Get(std::string("api=download&FOLDER_SHARING=L1&file=") + file, {alice});
        EXPECT_EQ(refused.head.find("Content-Disposition"), std::string::npos) << file;
        EXPECT_NE(refused.body.find("\"success\":false"), std::string::npos) << file;
    }
    EXPECT_EQ(Records(), (Lines{"client=\"127.0.0.1\" user=\"alice\" action=\"download\" size=200000 type=file "
                                "path=\"/public/dir/\xC3\xA9\\x22q.bin\""}));
    EXPECT_EQ(app_.ErrorLines(), Lines{});
}

}  // namespace
