// Password verification against the shadow database.
#pragma once

namespace norvo::platform {

enum class PasswordCheck {
    kMatch,
    kRefused,  // wrong password, locked or passwordless account, or no shadow entry
    kFailed,   // the shadow database could not be read (*err holds the errno)
};

// Checks password against the shadow entry of user with crypt(3).
[[nodiscard]] PasswordCheck CheckPassword(const char *user, const char *password, int *err);

}  // namespace norvo::platform
