// Login session identifiers: random, URL-safe, and checked before they reach the database.
#pragma once
#include <string>
#include <string_view>

namespace norvo::platform {

// 24 random bytes in URL-safe base64 without padding.
inline constexpr size_t kSidLength = 32;
// Longest text accepted as a sid; anything longer can't be one of ours.
inline constexpr size_t kMaxSidLength = 128;

// A fresh sid from getrandom. 0 and *sid, or the errno.
[[nodiscard]] int NewSid(std::string *sid);

// true when text could be a sid: 1 to kMaxSidLength characters of A-Z a-z 0-9 '-' '_'.
[[nodiscard]] bool IsWellFormedSid(std::string_view text);

}  // namespace norvo::platform
