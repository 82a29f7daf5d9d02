// Making untrusted bytes (paths, names) safe to print, and the printed form losslessly back.
#pragma once
#include <string>
#include <string_view>

namespace norvo::cli {

// True when text is well-formed UTF-8 (RFC 3629).
bool IsValidUtf8(std::string_view text);

// text with every byte that is not part of a well-formed UTF-8 sequence replaced by U+FFFD.
// JSON strings must be Unicode; jsoncpp itself would merge a broken sequence with the bytes
// after it ("\xC3/" becomes one wrong character), so strings are cleaned before it sees them.
std::string ValidUtf8(std::string_view text);

// The escaped form, in which norvo prints every name and path in text: each byte of malformed
// UTF-8, of a control character (C0, DEL, C1), of a format character (bidi embeddings,
// overrides and isolates, zero-width characters, BOM...) and of U+2028 and U+2029 becomes
// \xNN (upper-case hex), and a backslash is doubled where it would otherwise begin "\\" or
// "\x" (before a backslash, an "x" or a \xNN). Everything else is unchanged, so an ordinary
// name, CORP\dave included, prints as it is, while a hostile one can neither move the cursor,
// reorder the line nor pass for another name: two byte strings never give the same form.
std::string TerminalSafe(std::string_view text);

// The bytes an escaped form stands for: "\\" is "\", "\xNN" (hex, either case) the byte NN,
// and any other backslash itself. False (with *bytes unspecified) for "\x" without two hex
// digits and for \x00, which no path can hold. Unescape(TerminalSafe(s)) == s for every s
// without NUL.
bool Unescape(std::string_view text, std::string *bytes);

}  // namespace norvo::cli
