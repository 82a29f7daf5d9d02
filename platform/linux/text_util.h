// Byte-string helpers of the platform core: trimming, ASCII case, UTF-8 validity, booleans of
// the configuration files, lexical paths, and malloc'd copies for C records.
#pragma once
#include <stddef.h>

#include <string>
#include <string_view>

namespace norvo::platform {

// Longest user, group or share name accepted; longer input is a bad argument.
inline constexpr size_t kMaxNameLength = 256;

// Space, tab, CR, LF, VT and FF; never locale-dependent.
[[nodiscard]] bool IsSpaceByte(char c);
[[nodiscard]] std::string_view TrimSpace(std::string_view text);
[[nodiscard]] std::string ToLowerAscii(std::string_view text);
[[nodiscard]] bool EqualsIgnoreCase(std::string_view a, std::string_view b);

// true when text is well-formed UTF-8 (no overlong forms, surrogates or code points above
// U+10FFFF).
[[nodiscard]] bool IsValidUtf8(std::string_view text);

// true when text can be a line of a configuration file we trust: valid UTF-8 without control
// characters other than tab (a NUL, CR or ESC in a value is damage, not content).
[[nodiscard]] bool IsCleanConfigText(std::string_view text);

// A name a caller may pass: not null, not empty, at most kMaxNameLength bytes, valid UTF-8,
// no control characters.
[[nodiscard]] bool IsAcceptableName(const char *name);

// yes/no, true/false, on/off, 1/0, ignoring case and surrounding spaces. false when text is
// none of them (*value untouched).
[[nodiscard]] bool ParseBool(std::string_view text, bool *value);

// The absolute path with empty and "." components dropped and ".." applied, no trailing
// slash ("/" for the root). "" when path is not absolute. Symbolic links are not followed.
[[nodiscard]] std::string NormalizePath(std::string_view path);
// true when path (normalised) is root or lies below it, comparing whole components:
// "/volume1/homes/a" is within "/volume1/homes", "/volume1/homesick" is not.
[[nodiscard]] bool PathIsWithin(std::string_view root, std::string_view path);

// A malloc'd, NUL-terminated copy for C records (freed with free); null when out of memory.
[[nodiscard]] char *DupCString(std::string_view text);

}  // namespace norvo::platform
