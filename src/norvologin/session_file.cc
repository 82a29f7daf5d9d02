#include "norvologin/session_file.h"

#include <arpa/inet.h>
#include <errno.h>
#include <fcntl.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/sysinfo.h>
#include <unistd.h>

#ifdef __SSE2__
#include <emmintrin.h>
#endif

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

namespace {

// The offsets of the first commas (up to eight) of p[0, length) into commas, and their number;
// *bad when a CR or NUL is among those bytes. Returns the piece's length: up to its LF, else
// length.
#ifdef __SSE2__
// A piece that ends within its first 64 bytes, as lines mostly do: its separators come from one
// 64-bit mask each (the caller's padding makes the 64 bytes readable). false when it does not
// end there.
bool ScanShort(const char *p, size_t avail, PlainLine *out, bool *plain, size_t *length) {
    const __m128i comma = _mm_set1_epi8(','), lf = _mm_set1_epi8('\n'), cr = _mm_set1_epi8('\r');
    const __m128i nul = _mm_setzero_si128();
    uint64_t cm = 0, nm = 0, bm = 0;
    for (int k = 0; k < 4; ++k) {
        const __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i *>(p + 16 * k));
        const int shift = 16 * k;
        cm |= static_cast<uint64_t>(static_cast<unsigned>(_mm_movemask_epi8(_mm_cmpeq_epi8(v, comma))))
              << shift;
        nm |= static_cast<uint64_t>(static_cast<unsigned>(_mm_movemask_epi8(_mm_cmpeq_epi8(v, lf)))) << shift;
        bm |= static_cast<uint64_t>(static_cast<unsigned>(
                  _mm_movemask_epi8(_mm_or_si128(_mm_cmpeq_epi8(v, cr), _mm_cmpeq_epi8(v, nul)))))
              << shift;
    }
    if (avail < 64) {
        nm &= (uint64_t{1} << avail) - 1;
    }
    if (nm == 0) {
        return false;
    }
    const size_t end = static_cast<size_t>(__builtin_ctzll(nm));
    const uint64_t before = (nm & (0 - nm)) - 1;
    *length = end + 1;
    cm &= before;
    // An empty field, which strtok would not see: a comma first, two together, or one last.
    const uint64_t last = end > 0 ? uint64_t{1} << (end - 1) : 1;
    *plain = (bm & before) == 0 && (cm & 1) == 0 && (cm & (cm >> 1)) == 0 && (cm & last) == 0;
    size_t start = 0;
    int k = 0;
    for (; *plain && cm != 0 && k < 8; cm &= cm - 1, ++k) {
        const size_t pos = static_cast<size_t>(__builtin_ctzll(cm));
        out->field[k] = std::string_view(p + start, pos - start);
        start = pos + 1;
    }
    if (k != 7 || cm != 0) {
        *plain = false;
    } else if (*plain) {
        out->field[7] = std::string_view(p + start, end - start);
    }
    return true;
}
#endif

#ifdef __SSE2__
size_t FindSeparators(const char *p, size_t length, size_t (&commas)[8], int *count, bool *bad) {
    const __m128i comma = _mm_set1_epi8(','), lf = _mm_set1_epi8('\n'), cr = _mm_set1_epi8('\r');
    const __m128i nul = _mm_setzero_si128();
    int n = 0;
    unsigned badBits = 0;
    for (size_t i = 0; i < length; i += 16) {
        const __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i *>(p + i));
        unsigned cm = static_cast<unsigned>(_mm_movemask_epi8(_mm_cmpeq_epi8(v, comma)));
        unsigned nm = static_cast<unsigned>(_mm_movemask_epi8(_mm_cmpeq_epi8(v, lf)));
        unsigned bm = static_cast<unsigned>(
            _mm_movemask_epi8(_mm_or_si128(_mm_cmpeq_epi8(v, cr), _mm_cmpeq_epi8(v, nul))));
        if (length - i < 16) {
            const unsigned inside = (1u << (length - i)) - 1;  // the rest is not this piece's
            cm &= inside, nm &= inside, bm &= inside;
        }
        const unsigned before = nm != 0 ? (nm & (0u - nm)) - 1 : ~0u;
        badBits |= bm & before;
        for (cm &= before; cm != 0; cm &= cm - 1, ++n) {
            if (n < 8) {
                commas[n] = i + static_cast<size_t>(__builtin_ctz(cm));
            }
        }
        if (nm != 0) {
            *count = n, *bad = badBits != 0;
            return i + static_cast<size_t>(__builtin_ctz(nm)) + 1;
        }
    }
    *count = n, *bad = badBits != 0;
    return length;
}
#else
size_t FindSeparators(const char *p, size_t length, size_t (&commas)[8], int *count, bool *bad) {
    int n = 0;
    *bad = false;
    for (size_t i = 0; i < length; ++i) {
        const char c = p[i];
        if (c == '\n') {
            *count = n;
            return i + 1;
        }
        if (c == ',') {
            if (n < 8) {
                commas[n] = i;
            }
            ++n;
        } else if (c == '\r' || c == '\0') {
            *bad = true;
        }
    }
    *count = n;
    return length;
}
#endif

}  // namespace

size_t ScanLine(const char *p, size_t avail, PlainLine *out, bool *plain) {
#ifdef __SSE2__
    if (size_t length = 0; ScanShort(p, avail, out, plain, &length)) {
        return length;
    }
#endif
    size_t commas[8];
    int count = 0;
    bool bad = false;
    const size_t length =
        FindSeparators(p, std::min(avail, static_cast<size_t>(kLineBuffer) - 1), commas, &count, &bad);
    *plain = false;
    if (bad || count != 7 || p[length - 1] != '\n') {
        return length;
    }
    commas[7] = length - 1;
    size_t start = 0;
    for (int i = 0; i < 8; ++i) {
        if (commas[i] == start) {
            return length;  // an empty field, which strtok would not see
        }
        out->field[i] = std::string_view(p + start, commas[i] - start);
        start = commas[i] + 1;
    }
    *plain = true;
    return length;
}

long NumberOfText(std::string_view field) {
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

bool ExpiredWithoutTime() {
    NVO_SET_QUIB_ERR(kModule, QUIB_ERR_BAD_PARAMETER);
    return true;
}

int OpenOwnFile(const char *path, bool forWriting, off_t *size) {
    const int flags = (forWriting ? O_WRONLY | O_CREAT : O_RDONLY) | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
    if (forWriting) {
        // The scratch file is renamed away after each rewrite, so it is normally made here, new
        // and ours: nothing left to check.
        const int fd = open(path, flags | O_EXCL, 0600);
        if (fd >= 0 && fchmod(fd, 0600) == 0) {
            if (size != nullptr) {
                *size = 0;
            }
            return fd;
        }
        if (fd >= 0 || errno != EEXIST) {
            const int err = errno;
            if (fd >= 0) {
                close(fd);
            }
            errno = err;
            return -1;
        }
    }
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
    if (size != nullptr) {
        *size = forWriting ? 0 : st.st_size;
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

bool ReadPadded(int fd, size_t sizeHint, FileText *text) {
    // One byte over the size expected, so that a single read normally brings all of it.
    size_t capacity = sizeHint + 1;
    text->data.reset(new char[capacity + kScanPad]);
    text->size = 0;
    for (;;) {
        if (text->size == capacity) {
            capacity *= 2;
            std::unique_ptr<char[]> grown(new char[capacity + kScanPad]);
            memcpy(grown.get(), text->data.get(), text->size);
            text->data = std::move(grown);
        }
        const size_t asked = capacity - text->size;
        const ssize_t got = read(fd, text->data.get() + text->size, asked);
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got < 0) {
            return false;
        }
        text->size += static_cast<size_t>(got);
        // A short read that brings exactly the size the file had is its end (the caller holds
        // the file's lock); anything else reads on until read says so.
        if (got == 0 || (static_cast<size_t>(got) < asked && text->size == sizeHint)) {
            break;
        }
    }
    memset(text->data.get() + text->size, 0, kScanPad);
    return true;
}

}  // namespace norvo::login
