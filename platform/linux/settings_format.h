// The text of the appliance's settings files, parsed into lines that can be rewritten without
// disturbing the lines not touched (comments, blank lines, line endings).
//
//   # comment
//   key="value with \"quotes\" and = signs"
//   other = unquoted value
#pragma once
#include <stddef.h>

#include <string>
#include <string_view>
#include <vector>

namespace norvo::platform {

inline constexpr size_t kMaxSettingsKeyLength = 256;
inline constexpr size_t kMaxSettingsValueLength = 1 << 20;

struct SettingsLine {
    std::string text;  // the line without its ending
    std::string eol;   // "\n", "\r\n", or "" for a last line without newline
    bool isEntry = false;
    std::string key;    // entries only
    std::string value;  // entries only, quotes and escapes removed
};

// Every line of text, in order; comments, blank and malformed lines are kept as non-entries.
[[nodiscard]] std::vector<SettingsLine> ParseSettings(std::string_view text);
// The file text again, byte for byte for lines not changed.
[[nodiscard]] std::string RenderSettings(const std::vector<SettingsLine> &lines);

// True when key can be written: 1..kMaxSettingsKeyLength bytes of valid UTF-8 without white
// space, control characters or '=', not starting with '#' or a quote.
[[nodiscard]] bool IsWritableKey(std::string_view key);
// True when value can be written in format (0 quoted, 1 bare): valid UTF-8 without line breaks
// or other control characters except tab, at most kMaxSettingsValueLength bytes; bare values
// must also read back unchanged (no surrounding white space, no leading quote).
[[nodiscard]] bool IsWritableValue(std::string_view value, int format);
// The line for key and value: key="value" (\" and \\ escaped) or key=value.
[[nodiscard]] std::string FormatEntry(std::string_view key, std::string_view value, int format);

// True when the key of line matches key (ignoring ASCII case when ignoreCase).
[[nodiscard]] bool KeyMatches(const SettingsLine &line, std::string_view key, bool ignoreCase);

// The first entry for key, which is the one readers see; null when absent.
[[nodiscard]] const SettingsLine *FindSettingsEntry(const std::vector<SettingsLine> &lines,
                                                    std::string_view key, bool ignoreCase);

}  // namespace norvo::platform
