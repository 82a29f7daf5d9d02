// Random session identifiers.
#include "login_sid.h"

#include <errno.h>
#include <sys/random.h>

namespace norvo::platform {
namespace {

constexpr char kAlphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";
constexpr size_t kRandomBytes = kSidLength / 4 * 3;

bool IsSidChar(char c) {
    return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '-' || c == '_';
}

}  // namespace

int NewSid(std::string *sid) {
    unsigned char bytes[kRandomBytes];
    size_t filled = 0;
    while (filled < sizeof bytes) {
        const ssize_t got = getrandom(bytes + filled, sizeof bytes - filled, 0);
        if (got < 0) {
            if (errno == EINTR) {
                continue;
            }
            return errno;
        }
        filled += static_cast<size_t>(got);
    }
    sid->clear();
    for (size_t i = 0; i < sizeof bytes; i += 3) {
        const unsigned group = (bytes[i] << 16) | (bytes[i + 1] << 8) | bytes[i + 2];
        for (int shift = 18; shift >= 0; shift -= 6) {
            *sid += kAlphabet[(group >> shift) & 0x3F];
        }
    }
    return 0;
}

bool IsWellFormedSid(std::string_view text) {
    if (text.empty() || text.size() > kMaxSidLength) {
        return false;
    }
    for (char c : text) {
        if (!IsSidChar(c)) {
            return false;
        }
    }
    return true;
}

}  // namespace norvo::platform
