// Making untrusted bytes (paths, names) safe to print.
#pragma once
#include <string>
#include <string_view>

namespace norvo::cli {

// text with every byte that is not part of a well-formed UTF-8 sequence replaced by U+FFFD.
// JSON strings must be Unicode; jsoncpp itself would merge a broken sequence with the bytes
// after it ("\xC3/" becomes one wrong character), so strings are cleaned before it sees them.
std::string ValidUtf8(std::string_view text);

// text for a terminal: control characters and bytes of malformed UTF-8 written as \xNN, so a
// hostile name can neither move the cursor nor garble the line. Everything else is unchanged.
std::string TerminalSafe(std::string_view text);

}  // namespace norvo::cli
