#include "norvologin/session_file.h"

#include <arpa/inet.h>
#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/sysinfo.h>
#include <unistd.h>

#include "common/log.h"
#include "quib_cgi.h"

namespace norvo::login {
namespace {

// The three parts every name of the session file is made of.
const char *const kDir = "/tmp";
const char *const kName = "foldersharing";
const char *const kSuffix = "current.users";

// Each name is the one format applied to the three parts.
#define NAMED(format)                                              \
    [] {                                                           \
        char text[256];                                            \
        snprintf(text, sizeof text, format, kDir, kName, kSuffix); \
        return std::string(text);                                  \
    }()

bool IsIpLiteral(const char *text) {
    unsigned char addr[sizeof(struct in6_addr)];
    return inet_pton(AF_INET, text, addr) == 1 || inet_pton(AF_INET6, text, addr) == 1;
}

}  // namespace

const std::string &SessionFile() {
    static const std::string path = NAMED("%s/%s.%s");
    return path;
}
const std::string &SessionLock() {
    static const std::string path = NAMED("%s/%s.%s.lock");
    return path;
}
const std::string &SessionScratch() {
    static const std::string path = NAMED("%s/%s.%s.tmp");
    return path;
}

bool ClientAddress(char (&out)[64]) {
    std::string text;
    if (const char *forwarded = getenv("HTTP_X_FORWARDED_FOR")) {
        text = forwarded;
        text = text.substr(0, text.find(','));
    } else if (const char *clientIp = getenv("HTTP_CLIENT_IP")) {
        text = clientIp;
    } else if (const char *remote = getenv("REMOTE_ADDR")) {
        text = remote;
    } else {
        return false;
    }
    snprintf(out, sizeof out, "%s", text.c_str());
    return text.size() < sizeof out && IsIpLiteral(out);
}

bool SessionLine::Persistent() const {
    return atoi(field[6]) != 0;
}

long SessionLine::LastAccess() const {
    return atol(field[4]);
}

bool ParseLine(char *line, SessionLine *out) {
    // A line end left in field 7 would be written back as a line of its own.
    line[strcspn(line, "\r\n")] = '\0';
    static const char *const kEnds[8] = {",", ",", ",", ",", ",", ",\r\n", ",", ",\r\n"};
    char *save = nullptr;
    for (int i = 0; i < 8; ++i) {
        out->field[i] = strtok_r(i == 0 ? line : nullptr, kEnds[i], &save);
        if (out->field[i] == nullptr) {
            if (i < 6) {
                return false;
            }
            out->field[i] = "0";
        }
    }
    return true;
}

bool SplitPlain(std::string_view piece, PlainLine *out) {
    if (piece.empty() || piece.back() != '\n') {
        return false;
    }
    // One pass over the bytes: this runs for every line of the file at every request.
    const char *p = piece.data();
    const char *const end = p + piece.size() - 1;
    const char *start = p;
    int n = 0;
    for (; p < end; ++p) {
        const char c = *p;
        if (c == ',') {
            if (p == start || n == 7) {
                return false;
            }
            out->field[n++] = std::string_view(start, static_cast<size_t>(p - start));
            start = p + 1;
        } else if (c == '\r' || c == '\0') {
            return false;
        }
    }
    if (p == start || n != 7) {
        return false;
    }
    out->field[7] = std::string_view(start, static_cast<size_t>(p - start));
    return true;
}

long NumberOf(std::string_view field) {
    if (field.size() <= 18) {
        long value = 0;
        bool digits = true;
        for (const char c : field) {
            if (c < '0' || c > '9') {
                digits = false;
                break;
            }
            value = value * 10 + (c - '0');  // 18 digits stay below 2^63
        }
        if (digits) {
            return value;
        }
    }
    char small[32];
    if (field.size() < sizeof small) {
        memcpy(small, field.data(), field.size());
        small[field.size()] = '\0';
        return atol(small);
    }
    return atol(std::string(field).c_str());
}

bool Uptime(long *now) {
    struct sysinfo info;
    if (sysinfo(&info) != 0) {
        NVO_LOG(kModule, "%s (%d) sysinfo Failed, reason=%s", strerror(errno));
        return false;
    }
    *now = info.uptime;
    return true;
}

Clock ReadClock() {
    Clock clock;
    clock.haveNow = Uptime(&clock.now);
    const int minutes = VLIBCConfGetOBXTimeout();
    clock.timeoutSeconds = (minutes < 0 ? kDefaultTimeoutMinutes : minutes) * 60L;
    return clock;
}

bool Expired(const Clock &clock, long lastAccess) {
    if (lastAccess < 1) {
        NVO_SET_QUIB_ERR(kModule, QUIB_ERR_BAD_PARAMETER);
        return true;
    }
    return !clock.haveNow || lastAccess > clock.now || clock.now - lastAccess > clock.timeoutSeconds;
}

int OpenOwnFile(const char *path, bool forWriting) {
    const int flags = (forWriting ? O_WRONLY | O_CREAT : O_RDONLY) | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
    const int fd = open(path, flags, 0600);
    if (fd < 0) {
        return -1;
    }
    struct stat st {};
    // Emptied only once known to be ours: O_TRUNC would cut another user's file first.
    if (fstat(fd, &st) != 0 || !S_ISREG(st.st_mode) || st.st_uid != geteuid() ||
        (forWriting && (ftruncate(fd, 0) != 0 || fchmod(fd, 0600) != 0))) {
        const int err = S_ISREG(st.st_mode) && st.st_uid == geteuid() ? errno : EACCES;
        close(fd);
        errno = err;
        return -1;
    }
    return fd;
}

bool ReadAll(int fd, std::string *text) {
    char buf[65536];
    for (;;) {
        const ssize_t got = read(fd, buf, sizeof buf);
        if (got == 0) {
            return true;
        }
        if (got < 0) {
            if (errno == EINTR) {
                continue;
            }
            return false;
        }
        text->append(buf, static_cast<size_t>(got));
    }
}

}  // namespace norvo::login
