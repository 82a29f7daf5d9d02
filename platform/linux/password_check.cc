// Shadow lookups and crypt(3).
#include "password_check.h"

#include <crypt.h>
#include <errno.h>
#include <shadow.h>
#include <string.h>

#include <memory>
#include <string>
#include <vector>

namespace norvo::platform {
namespace {

constexpr size_t kMaxShadowBuffer = 1 << 20;

// Compares without stopping at the first difference, so the time taken does not tell how
// much of a guess was right.
bool SameText(const char *a, const char *b) {
    const size_t length = strlen(a);
    if (length != strlen(b)) {
        return false;
    }
    unsigned char difference = 0;
    for (size_t i = 0; i < length; ++i) {
        difference |= static_cast<unsigned char>(a[i] ^ b[i]);
    }
    return difference == 0;
}

// An empty hash would let anyone in; "!" and "*" mark locked or password-less accounts.
bool IsUsableHash(const char *hash) {
    return hash != nullptr && hash[0] != '\0' && hash[0] != '!' && hash[0] != '*';
}

}  // namespace

PasswordCheck CheckPassword(const char *user, const char *password, int *err) {
    std::vector<char> buffer(1024);
    struct spwd entry;
    struct spwd *found = nullptr;
    for (;;) {
        const int rc = getspnam_r(user, &entry, buffer.data(), buffer.size(), &found);
        if (rc == ERANGE && buffer.size() < kMaxShadowBuffer) {
            buffer.resize(buffer.size() * 2);
            continue;
        }
        if (rc != 0 && rc != ENOENT) {
            *err = rc;
            return PasswordCheck::kFailed;
        }
        break;
    }
    if (found == nullptr || !IsUsableHash(entry.sp_pwdp)) {
        return PasswordCheck::kRefused;
    }
    auto data = std::make_unique<struct crypt_data>();  // zeroed, as crypt_r requires
    const char *hashed = crypt_r(password, entry.sp_pwdp, data.get());
    // libxcrypt reports failure as null or as a token starting with '*'.
    if (hashed == nullptr || hashed[0] == '*') {
        return PasswordCheck::kRefused;
    }
    return SameText(hashed, entry.sp_pwdp) ? PasswordCheck::kMatch : PasswordCheck::kRefused;
}

}  // namespace norvo::platform
