#include <stdlib.h>
#include <syslog.h>
#include <unistd.h>

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/norvomisc.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::LogLine;
using Lines = std::vector<std::string>;

// The transfer records received, without the error lines.
std::vector<std::string> Records(Appliance &app) {
    std::vector<std::string> records;
    for (const LogLine &line : app.Logs()) {
        if (line.priority == LOG_INFO) {
            records.push_back(line.text);
        }
    }
    return records;
}

TEST(TransferLog, OneRecordPerLoggedActionWhateverTheIdentity) {
    Appliance app;
    app.Basic();
    setenv("REMOTE_ADDR", "192.0.2.9", 1);
    EXPECT_EQ(NvoLibDoLog("alice", "/photo/a", 5, NORVO_ACTION_UPLOAD, false), 0);  // the log is off
    app.SetSetting("filebrowserxferlog", "YES");
    EXPECT_EQ(NvoLibDoLog("alice", "/photo/a", 5, NORVO_ACTION_UPLOAD, false), 1);
    for (const int action : {0, 10, -1}) {
        EXPECT_EQ(NvoLibDoLog("alice", "/x", 1, static_cast<NORVO_ACTIONS>(action), false), 0) << action;
    }
    EXPECT_EQ(NvoLibDoFileBrowserLog("CORP\\dave", "/p/\"d\"\n<fake>", 0, NORVO_ACTION_DOWNLOAD_TEST, true), 1);
    EXPECT_EQ(app.RunAs("bob", [] { return NvoLibDoLog("bob", "/public/b", 7, NORVO_ACTION_PROPERTY_SET, false); }), 1);
    EXPECT_EQ(NvoLibDoFileBrowserLog("alice", "/photo/a", -1, NORVO_ACTION_DELETE, false), 0);  // refused record
    unsetenv("REMOTE_ADDR");
    EXPECT_EQ(NvoLibDoLog("alice", "/photo/a", 5, NORVO_ACTION_MKDIR, false), 0);
    setenv("REMOTE_ADDR", "192.0.2.9", 1);
    EXPECT_EQ(NvoLibDoLog("", "/photo/a", 5, NORVO_ACTION_MKDIR, false), 0);
    EXPECT_EQ(Records(app),
              (Lines{"client=\"192.0.2.9\" user=\"alice\" action=\"upload\" size=5 type=file path=\"/photo/a\"",
                     "client=\"192.0.2.9\" user=\"CORP\\x5Cdave\" action=\"download test\" size=0 type=dir "
                     "path=\"/p/\\x22d\\x22\\x0A<fake>\"",
                     "client=\"192.0.2.9\" user=\"bob\" action=\"property set\" size=7 type=file path=\"/public/b\""}));
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvomisc.cpp:# Failed to add the File Browser log for /photo/a",
                                       "norvomisc.cpp:# Bad parameters.", "norvomisc.cpp:# Bad parameters."}));
}

TEST(TransferLog, RemoteAddressFromEachSource) {
    Appliance app;
    app.Basic().WriteFile("/usr/quib/etc/ddns.conf", "home.hostname=nas.example.net\nbad.hostname=\"a b<\"\n");
    const std::string ddns = "ddns_update=yes\nddns_select=home\n";
    struct Row {
        const char *https, *host, *settings, *defaults, *want;
        Lines lines;
    } rows[] = {
        {nullptr, "nas:5000/x", "", "", "http://nas:5000", {}},
        {"ON", "[fe80::1]:5001", "", "", "https://[fe80::1]:5001", {}},
        {"off", "[fe80::1%eth0]", "", "", "http://[fe80::1%eth0]", {}},
        {nullptr, nullptr, "", "", "http://", {}},
        {nullptr, "nas:50x0", "", "", "http://nas", {}},
        {nullptr, "a\"><script>:80", "", "", "http://:80", {}},
        {nullptr, "nas:5000", "external_host_ip=203.0.113.5\nexternal_port_obx_http=8080\n", "",
         "http://203.0.113.5:8080", {}},
        {"on", "nas:5001", "external_port_obx_https=\nexternal_port_obx_http=1\n", "", "https://nas:5001", {}},
        {"on", "nas:5001", "external_port_obx_https=443\n", "", "https://nas:443", {}},
        {nullptr, "nas:5000", ddns.c_str(), "supportddns=yes\n", "http://nas.example.net:5000", {}},
        {nullptr, "nas:5000", ddns.c_str(), "", "http://nas:5000", {}},
        {nullptr, "nas", "ddns_update=no\nddns_select=home\n", "supportddns=yes\n", "http://nas", {}},
        {nullptr, "nas", nullptr, "supportddns=yes\n", "http://nas",
         {"norvomisc.cpp:# Failed to get ddns_update of /etc/quibinfo.conf"}},
        {nullptr, "nas", "ddns_update=yes\n", "supportddns=yes\n", "http://nas",
         {"norvomisc.cpp:# Failed to get ddns_select of /etc/quibinfo.conf"}},
        {nullptr, "nas", "ddns_update=yes\nddns_select=gone\n", "supportddns=yes\n", "http://nas",
         {"norvomisc.cpp:# Failed to get DDNS info by select name gone, errno=No such file or directory, "
          "quib_error=[900]"}},
        {nullptr, "nas", "ddns_update=yes\nddns_select=bad\n", "supportddns=yes\n", "http://nas",
         {"norvomisc.cpp:# Failed to get DDNS info by select name bad, errno=Invalid argument, quib_error=[D00]"}},
    };
    for (const Row &row : rows) {
        app.WriteFile("/etc/quibinfo.conf", row.settings ? row.settings : "").WriteFile("/etc.defaults/quibinfo.conf", row.defaults);
        row.settings ? 0 : unlink("/etc/quibinfo.conf");
        row.https ? setenv("HTTPS", row.https, 1) : unsetenv("HTTPS");
        row.host ? setenv("HTTP_HOST", row.host, 1) : unsetenv("HTTP_HOST");
        app.ClearLogs();
        std::string out = "old";
        EXPECT_EQ(GetRemoteAddr(out), row.want) << (row.host ? row.host : "no host") << " " << (row.settings ? row.settings : "no settings");
        EXPECT_EQ(app.ErrorLines(), row.lines) << row.host;
    }
}

}  // namespace
