// The session file of sharing-link visitors, shared by login and authorisation: its names, the
// client's address, the parsing of a line, the expiry test, and opening its files.
#pragma once
#include <string.h>
#include <sys/types.h>

#include <algorithm>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace norvo::login {

inline constexpr char kModule[] = "norvologin";
inline constexpr int kLockTimeoutMs = 30000;
inline constexpr int kLineBuffer = 748;  // a line (with its LF) is read in pieces of this, less one
inline constexpr int kDefaultTimeoutMinutes = 15;

// "/tmp/foldersharing.current.users" and its ".lock" and ".tmp" companions.
const std::string &SessionFile();
const std::string &SessionLock();
const std::string &SessionScratch();

// The client's address into out (64 bytes): X-Forwarded-For up to its first ",", else
// Client-IP, else REMOTE_ADDR. false when none is set or the text is not an IPv4 or IPv6
// literal: anything else could not be compared, blocked, or written into a line safely.
bool ClientAddress(char (&out)[64]);

// One line split as every reader splits it; fields 7 and 8 read "0" when missing.
struct SessionLine {
    const char *field[8];
    bool Persistent() const;
    long LastAccess() const;
};
// Splits line (modified in place; its line end removed first). false for fewer than six fields.
bool ParseLine(char *line, SessionLine *out);

// The uptime and the timeout, read once for a whole pass over the file.
struct Clock {
    bool haveNow = false;  // false: sysinfo failed (logged), so everything counts as expired
    long now = 0;
    long timeoutSeconds = kDefaultTimeoutMinutes * 60;
};
// The current uptime (sysinfo); false, logged, on failure.
bool Uptime(long *now);
Clock ReadClock();
// A last access below 1, ahead of now (a /tmp kept across a restart) or older than the timeout.
bool ExpiredWithoutTime();  // sets the error slot
inline bool Expired(const Clock &clock, long lastAccess) {
    if (lastAccess < 1) {
        return ExpiredWithoutTime();
    }
    return !clock.haveNow || lastAccess > clock.now || clock.now - lastAccess > clock.timeoutSeconds;
}

// Opens path without following a link and without blocking on a FIFO; anything but a regular
// file of the effective user is refused (EACCES). forWriting: made 0600 when missing, and
// emptied. *size (when given) is the size of the file opened.
int OpenOwnFile(const char *path, bool forWriting, off_t *size = nullptr);
// The whole file of descriptor fd; false on a read error.
bool ReadAll(int fd, std::string *text);
// Calls fn with each piece of text that fgets with a buffer of bufferSize would give.
template <typename F>
void ForEachPiece(const std::string &text, int bufferSize, F &&fn) {
    const size_t most = static_cast<size_t>(bufferSize) - 1;
    for (size_t pos = 0; pos < text.size();) {
        size_t n = std::min(most, text.size() - pos);
        if (const void *end = memchr(text.data() + pos, '\n', n)) {
            n = static_cast<size_t>(static_cast<const char *>(end) - (text.data() + pos)) + 1;
        }
        fn(std::string_view(text.data() + pos, n));
        pos += n;
    }
}

// The session file's text, followed by kScanPad zero bytes that ScanLine may look at.
inline constexpr size_t kScanPad = 64;
struct FileText {
    std::unique_ptr<char[]> data;
    size_t size = 0;
};
// The whole file of fd (of about sizeHint bytes); false on a read error.
bool ReadPadded(int fd, size_t sizeHint, FileText *text);

// A piece as the session's own writers write a line: LF-ended, eight non-empty fields, no CR
// or NUL. Its fields are exactly what ParseLine gives, and written back unchanged it is these
// same bytes, so the many lines an authorisation only carries over need no formatting.
struct PlainLine {
    std::string_view field[8];
};
// The length of the piece at p that fgets with a kLineBuffer buffer would give, of the avail
// bytes left (kScanPad more readable after them); *plain tells whether it is a plain line,
// whose fields are then in *out. Every line of the file at every request goes through here.
size_t ScanLine(const char *p, size_t avail, PlainLine *out, bool *plain);
// atol of a field that is not terminated.
long NumberOfText(std::string_view field);
// Inline: it runs for every line of the file at every request.
inline long NumberOf(std::string_view field) {
    if (field.size() <= 18) {
        long value = 0;
        for (const char c : field) {
            if (c < '0' || c > '9') {
                return NumberOfText(field);
            }
            value = value * 10 + (c - '0');  // 18 digits stay below 2^63
        }
        return value;
    }
    return NumberOfText(field);
}

}  // namespace norvo::login
