// Login lookups shared by the calls that trust a sid (WebMan, privilege lookups).
#pragma once
#include <string>

namespace norvo::platform {

enum class LoginState {
    kLive,     // the sid is a live login; its expiry was moved on
    kUnknown,  // no such sid, or it expired, or it is malformed
    kFailed,   // the records could not be read
};

// Looks sid up and slides its expiry. *code receives the platform code of a state other than
// kLive (0x0300 unknown, 0x0D00 malformed, others for failures).
[[nodiscard]] LoginState FindLogin(const char *sid, std::string *user, int *code);

// The check of the calls that act for user on the strength of sid: true when sid is a live
// login of user, with the name it was made under in *loggedIn; else false with the slot set
// (FindLogin's code, or 0x0300 when the login is someone else's). Names compare ignoring ASCII
// case, the folding Windows and directory names share.
[[nodiscard]] bool IsLoginOf(const char *sid, const char *user, std::string *loggedIn);

// The session lifetime in seconds, from "login_timeout_minutes" in QUIB_INFO_CONF (decimal
// digits only, 1 to 525600); 15 minutes when the key is absent or not such a number.
[[nodiscard]] long LoginLifetimeSeconds();

}  // namespace norvo::platform
