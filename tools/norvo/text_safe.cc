#include "text_safe.h"

#include <unicode/uchar.h>

namespace norvo::cli {
namespace {

// Length of the well-formed UTF-8 sequence at text[pos], or 0 when the byte there starts none
// (RFC 3629: no overlong forms, no surrogates, nothing above U+10FFFF).
size_t SequenceLength(std::string_view text, size_t pos) {
    const auto byte = [&](size_t i) { return static_cast<unsigned char>(text[pos + i]); };
    const size_t left = text.size() - pos;
    const unsigned char lead = byte(0);
    if (lead < 0x80) {
        return 1;
    }
    size_t length = 0;
    unsigned char low = 0x80;
    unsigned char high = 0xBF;
    if (lead >= 0xC2 && lead <= 0xDF) {
        length = 2;
    } else if (lead >= 0xE0 && lead <= 0xEF) {
        length = 3;
        low = lead == 0xE0 ? 0xA0 : 0x80;
        high = lead == 0xED ? 0x9F : 0xBF;
    } else if (lead >= 0xF0 && lead <= 0xF4) {
        length = 4;
        low = lead == 0xF0 ? 0x90 : 0x80;
        high = lead == 0xF4 ? 0x8F : 0xBF;
    } else {
        return 0;
    }
    if (left < length || byte(1) < low || byte(1) > high) {
        return 0;
    }
    for (size_t i = 2; i < length; ++i) {
        if (byte(i) < 0x80 || byte(i) > 0xBF) {
            return 0;
        }
    }
    return length;
}

void AppendHexBytes(std::string &out, std::string_view bytes) {
    static constexpr char kHex[] = "0123456789ABCDEF";
    for (const char c : bytes) {
        const auto byte = static_cast<unsigned char>(c);
        out += "\\x";
        out += kHex[byte >> 4];
        out += kHex[byte & 0xF];
    }
}

// The code point of the well-formed sequence of length bytes at sequence.
UChar32 CodePoint(const char *sequence, size_t length) {
    const auto byte = [&](size_t i) { return static_cast<unsigned char>(sequence[i]); };
    static constexpr unsigned char kLeadMask[] = {0, 0x7F, 0x1F, 0x0F, 0x07};
    UChar32 c = byte(0) & kLeadMask[length];
    for (size_t i = 1; i < length; ++i) {
        c = (c << 6) | (byte(i) & 0x3F);
    }
    return c;
}

// Characters that change how the line shows rather than showing themselves.
bool IsInvisible(UChar32 c) {
    switch (u_charType(c)) {
        case U_CONTROL_CHAR:
        case U_FORMAT_CHAR:
        case U_LINE_SEPARATOR:
        case U_PARAGRAPH_SEPARATOR:
            return true;
        default:
            return false;
    }
}

// Whether the sequence of length bytes at text[pos] (0: a malformed byte) is printed as \xNN.
bool NeedsHex(std::string_view text, size_t pos, size_t length) {
    return length == 0 || IsInvisible(CodePoint(text.data() + pos, length));
}

int HexValue(char c) {
    if (c >= '0' && c <= '9')
        return c - '0';
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    if (c >= 'A' && c <= 'F')
        return c - 'A' + 10;
    return -1;
}

}  // namespace

bool IsValidUtf8(std::string_view text) {
    for (size_t pos = 0; pos < text.size();) {
        const size_t length = SequenceLength(text, pos);
        if (length == 0) {
            return false;
        }
        pos += length;
    }
    return true;
}

std::string ValidUtf8(std::string_view text) {
    static constexpr char kReplacement[] = "\xEF\xBF\xBD";
    std::string out;
    out.reserve(text.size());
    for (size_t pos = 0; pos < text.size();) {
        const size_t length = SequenceLength(text, pos);
        if (length == 0) {
            out += kReplacement;
            ++pos;
        } else {
            out.append(text, pos, length);
            pos += length;
        }
    }
    return out;
}

std::string TerminalSafe(std::string_view text) {
    std::string out;
    out.reserve(text.size());
    for (size_t pos = 0; pos < text.size();) {
        const size_t length = SequenceLength(text, pos);
        if (NeedsHex(text, pos, length)) {
            AppendHexBytes(out, text.substr(pos, length == 0 ? 1 : length));
            pos += length == 0 ? 1 : length;
            continue;
        }
        if (text[pos] == '\\') {
            // Doubled only where the next thing printed would make it start an escape, so
            // CORP\dave stays as it is.
            const size_t next = pos + 1;
            const bool starts = next < text.size() && (text[next] == '\\' || text[next] == 'x' ||
                                                       NeedsHex(text, next, SequenceLength(text, next)));
            out += starts ? "\\\\" : "\\";
        } else {
            out.append(text, pos, length);
        }
        pos += length;
    }
    return out;
}

bool Unescape(std::string_view text, std::string *bytes) {
    bytes->clear();
    for (size_t pos = 0; pos < text.size(); ++pos) {
        const char next = pos + 1 < text.size() ? text[pos + 1] : '\0';
        if (text[pos] != '\\' || (next != '\\' && next != 'x')) {
            *bytes += text[pos];
            continue;
        }
        if (next == '\\') {
            *bytes += '\\';
            ++pos;
            continue;
        }
        const int high = pos + 3 < text.size() ? HexValue(text[pos + 2]) : -1;
        const int low = pos + 3 < text.size() ? HexValue(text[pos + 3]) : -1;
        if (high < 0 || low < 0 || (high == 0 && low == 0)) {
            return false;
        }
        *bytes += static_cast<char>(high * 16 + low);
        pos += 3;
    }
    return true;
}

}  // namespace norvo::cli
