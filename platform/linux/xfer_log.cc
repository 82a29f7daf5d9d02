// The file-transfer log, dynamic-DNS entries and QuibConf.
#include <errno.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <syslog.h>
#include <time.h>
#include <unistd.h>

#include <string>

#include "api_guard.h"
#include "fs_path.h"
#include "locked_file.h"
#include "quib_log.h"
#include "quib_paths.h"
#include "vlibc_file.h"

namespace {

using norvo::platform::FileDescriptor;
using norvo::platform::Guarded;

// A field as the record carries it: nothing in it can end the record or its quotes.
std::string Quoted(const char *text) {
    std::string out = "\"";
    for (const unsigned char *p = reinterpret_cast<const unsigned char *>(text); *p != 0; ++p) {
        if (*p < 0x20 || *p == 0x7F || *p == '"' || *p == '\\') {
            char hex[5];
            snprintf(hex, sizeof hex, "\\x%02X", *p);
            out += hex;
        } else {
            out += char(*p);
        }
    }
    return out + "\"";
}

// RFC 3164 time stamp, in the C locale's month names whatever the process's locale.
std::string Stamp() {
    static const char kMonths[12][4] = {"Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                        "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};
    const time_t now = time(nullptr);
    struct tm parts;
    localtime_r(&now, &parts);
    char buf[32];
    snprintf(buf, sizeof buf, "%s %2d %02d:%02d:%02d", kMonths[parts.tm_mon % 12], parts.tm_mday,
             parts.tm_hour, parts.tm_min, parts.tm_sec);
    return buf;
}

// Sends one record to the system log socket, datagram or (where the logger listens so) stream.
int SendRecord(const std::string &record) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    strcpy(address.sun_path, "/dev/log");
    for (const int type : {SOCK_DGRAM, SOCK_STREAM}) {
        FileDescriptor fd(socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
        if (!fd.IsOpen()) {
            return errno;
        }
        if (connect(fd.Get(), reinterpret_cast<const sockaddr *>(&address), sizeof address) != 0) {
            if (errno == EPROTOTYPE) {
                continue;
            }
            return errno;
        }
        const std::string data = type == SOCK_STREAM ? record + '\0' : record;
        for (size_t done = 0; done < data.size();) {
            const ssize_t n = send(fd.Get(), data.data() + done, data.size() - done, MSG_NOSIGNAL);
            if (n < 0 && errno != EINTR) {
                return errno;
            }
            done += n > 0 ? size_t(n) : 0;
        }
        return 0;
    }
    return EPROTOTYPE;
}

bool Empty(const char *text) {
    return text == nullptr || *text == '\0';
}

bool IsHostName(const char *name) {
    const size_t length = strlen(name);
    return length > 0 && length <= 253 &&
           strspn(name, "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789-.") == length;
}

// The value of "<name>.<field>" into out (size bytes); false when absent or unreadable.
bool DdnsField(const char *name, const char *field, char *out, size_t size) {
    const std::string key = std::string(name) + "." + field;
    return VLIBCFileGetKeyValue(QUIB_DDNS_CONF, key.c_str(), out, size, 0) > 0;
}

}  // namespace

extern "C" {

int QUIBLogOBXFMXferLog(const char *ip, const char *user, const char *action, long long size,
                        const char *path, int isDir) {
    if (Empty(ip) || Empty(user) || Empty(action) || Empty(path) || size < 0) {
        return NORVO_FAIL_ERRNO(EINVAL);
    }
    return Guarded(-1, [&] {
        const std::string record = "<" + std::to_string(LOG_LOCAL6 | LOG_INFO) + ">" + Stamp() +
                                   " " QUIB_XFERLOG_TAG "[" + std::to_string(getpid()) +
                                   "]: client=" + Quoted(ip) + " user=" + Quoted(user) +
                                   " action=" + Quoted(action) + " size=" + std::to_string(size) +
                                   " type=" + (isDir ? "dir" : "file") + " path=" + Quoted(path);
        const int err = SendRecord(record);
        return err == 0 ? 0 : NORVO_FAIL_ERRNO(err);
    });
}

int QUIBDDNSConfigGet(const char *name, PQUIB_DDNS_CONFIG config) {
    if (Empty(name) || config == nullptr || strlen(name) >= sizeof config->szName ||
        strpbrk(name, " \t=\"'#") != nullptr) {
        return NORVO_FAIL_ERRNO(EINVAL);
    }
    return Guarded(-1, [&] {
        QUIB_DDNS_CONFIG found{};
        strcpy(found.szName, name);
        if (!DdnsField(name, "hostname", found.szHostname, sizeof found.szHostname)) {
            QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
            errno = ENOENT;
            return -1;
        }
        if (!IsHostName(found.szHostname)) {
            return NORVO_FAIL_ERRNO(EINVAL);
        }
        (void)DdnsField(name, "provider", found.szProvider, sizeof found.szProvider);
        (void)DdnsField(name, "username", found.szUsername, sizeof found.szUsername);
        *config = found;
        return 0;
    });
}

int QuibConf(const char *key, const char *defaultValue, char *buf, size_t size) {
    if (Empty(key) || buf == nullptr || size == 0) {
        return NORVO_FAIL_ERRNO(EINVAL);
    }
    return Guarded(-1, [&] {
        const int got = VLIBCFileGetKeyValue(QUIB_INFO_CONF, key, buf, size, 0);
        if (got > 0) {
            return 0;
        }
        if (got < 0 && access(QUIB_INFO_CONF, F_OK) == 0) {
            return -1;  // there but unreadable: the reader's code stands
        }
        snprintf(buf, size, "%s", defaultValue != nullptr ? defaultValue : "");
        return 0;
    });
}

}  // extern "C"
