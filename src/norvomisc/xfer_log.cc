// The transfer log, and the device's address as the client sees it.
#include <errno.h>
#include <stdlib.h>
#include <string.h>
#include <strings.h>

#include <string>

#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/norvomisc.h"
#include "quib_log.h"
#include "quib_paths.h"
#include "vlibc_file.h"

using norvo::kNorvoMisc;

namespace {

constexpr size_t kHostMax = 4095;

const char *ActionWord(int action) {
    static const char *const kWords[] = {"download", "upload",       "delete", "rename",       "copy",
                                         "move",     "property set", "mkdir",  "download test"};
    return action >= 1 && action <= 9 ? kWords[action - 1] : nullptr;
}

std::string Env(const char *name) {
    const char *value = getenv(name);
    return value != nullptr ? value : "";
}

// A value of /etc/quibinfo.conf into at most size bytes; "" when absent or unreadable.
std::string Setting(const char *file, const char *key, size_t size, int *got = nullptr) {
    std::string buf(size, '\0');
    const int n = VLIBCFileGetKeyValue(file, key, &buf[0], size, 0);
    if (got != nullptr) {
        *got = n;
    }
    return n > 0 ? std::string(buf.c_str()) : std::string();
}

// Text that may stand as the host of a link: a host name or an address in brackets. What the
// client sent as its Host header comes back to it as a link, so nothing else goes through.
bool IsHostText(const std::string &host) {
    static const char kName[] = "0123456789abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ.-_";
    static const char kBracketed[] = "0123456789abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ.-_:%";
    if (host.size() > 2 && host.front() == '[' && host.back() == ']') {
        return host.find_first_not_of(kBracketed, 1) == host.size() - 1;
    }
    return host.find_first_not_of(kName) == std::string::npos;
}

// The host and port parts of an "HTTP_HOST" value.
void SplitHost(const std::string &value, std::string *host, std::string *port) {
    size_t end;
    if (!value.empty() && value[0] == '[') {
        const size_t close = value.find(']');
        end = close == std::string::npos ? value.size() : close + 1;
    } else {
        end = std::min(value.find_first_of(":/"), value.size());
    }
    *host = value.substr(0, std::min(end, kHostMax));
    port->clear();
    if (end < value.size() && value[end] == ':') {
        *port = value.substr(end + 1, value.find('/', end + 1) - (end + 1));
    }
    if (!IsHostText(*host)) {
        host->clear();
    }
    if (port->find_first_not_of("0123456789") != std::string::npos) {
        port->clear();
    }
}

// The host of the selected dynamic-DNS entry, when the device keeps one up to date; "" if not.
std::string DdnsHost() {
    if (VLIBCFileCheckKeyValue(QUIB_INFO_DEFAULTS_CONF, "supportddns", "yes", 1) != 1) {
        return "";
    }
    int got = 0;
    const std::string update = Setting(QUIB_INFO_CONF, "ddns_update", 8, &got);
    if (got < 0) {
        NVO_LOG(kNorvoMisc, "%s:%d Failed to get ddns_update of /etc/quibinfo.conf");
        return "";
    }
    if (strcasecmp(update.c_str(), "yes") != 0) {
        return "";
    }
    const std::string select = Setting(QUIB_INFO_CONF, "ddns_select", 128);
    if (select.empty()) {
        NVO_LOG(kNorvoMisc, "%s:%d Failed to get ddns_select of /etc/quibinfo.conf");
        return "";
    }
    QUIB_DDNS_CONFIG config{};
    if (QUIBDDNSConfigGet(select.c_str(), &config) != 0) {
        NVO_LOG(kNorvoMisc, "%s:%d Failed to get DDNS info by select name %s, errno=%s, quib_error=[%X]",
                select.c_str(), strerror(errno), VLIBCErrGet());
        return "";
    }
    return config.szHostname;
}

}  // namespace

int NvoLibDoFileBrowserLog(const std::string &user, const std::string &path, long long size,
                           NORVO_ACTIONS action, bool isDir) {
    return norvo::Guarded(0, [&] {
        const std::string client = Env("REMOTE_ADDR");
        if (user.empty() || path.empty() || client.empty()) {
            NVO_LOG(kNorvoMisc, "%s:%d Bad parameters.");
            return 0;
        }
        const char *word = ActionWord(action);
        if (word == nullptr) {
            return 0;
        }
        if (QUIBLogOBXFMXferLog(client.c_str(), user.c_str(), word, size, path.c_str(), isDir ? 1 : 0) ==
            -1) {
            NVO_LOG(kNorvoMisc, "%s:%d Failed to add the File Browser log for %s", path.c_str());
            return 0;
        }
        return 1;
    });
}

int NvoLibDoLog(const std::string &user, const std::string &path, long long size, NORVO_ACTIONS action,
                bool isDir) {
    return norvo::Guarded(0, [&] {
        char enabled[8] = "";
        if (QuibConf("filebrowserxferlog", "no", enabled, sizeof enabled) != 0 ||
            strcasecmp(enabled, "yes") != 0) {
            return 0;
        }
        return NvoLibDoFileBrowserLog(user, path, size, action, isDir);
    });
}

std::string &GetRemoteAddr(std::string &out) {
    norvo::GuardedVoid([&] {
        const bool https = strcasecmp(Env("HTTPS").c_str(), "on") == 0;
        std::string requestHost, requestPort;
        SplitHost(Env("HTTP_HOST"), &requestHost, &requestPort);
        std::string host = Setting(QUIB_INFO_CONF, "external_host_ip", 4096);
        if (host.empty()) {
            host = DdnsHost();
        }
        if (host.empty()) {
            host = requestHost;
        }
        std::string port =
            Setting(QUIB_INFO_CONF, https ? "external_port_obx_https" : "external_port_obx_http", 16);
        if (port.empty()) {
            port = requestPort;
        }
        out = (https ? "https://" : "http://") + host + (port.empty() ? "" : ":" + port);
    });
    return out;
}
