#include "json_text.h"

#include <math.h>
#include <stdio.h>

#include <algorithm>
#include <cstddef>

namespace norvo::cli {
namespace {

constexpr char kHex[] = "0123456789abcdef";

void AppendUnit(std::string &out, unsigned unit) {
    const char escape[] = {'\\',
                           'u',
                           kHex[(unit >> 12) & 0xF],
                           kHex[(unit >> 8) & 0xF],
                           kHex[(unit >> 4) & 0xF],
                           kHex[unit & 0xF]};
    out.append(escape, sizeof escape);
}

// Printable ASCII other than the two characters JSON escapes (char may be signed or not).
bool IsPlain(char c) {
    const auto byte = static_cast<unsigned char>(c);
    return byte >= 0x20 && byte < 0x80 && c != '"' && c != '\\';
}

void AppendQuoted(std::string &out, const char *text, const char *end) {
    out += '"';
    while (text != end) {
        const auto byte = static_cast<unsigned char>(*text);
        const char *plain = text;
        // Runs of printable ASCII are the common case: copied at once.
        while (text != end && IsPlain(*text)) {
            ++text;
        }
        if (text != plain) {
            out.append(plain, text);
            continue;
        }
        switch (byte) {
            case '"':
                out += "\\\"";
                break;
            case '\\':
                out += "\\\\";
                break;
            case '\b':
                out += "\\b";
                break;
            case '\f':
                out += "\\f";
                break;
            case '\n':
                out += "\\n";
                break;
            case '\r':
                out += "\\r";
                break;
            case '\t':
                out += "\\t";
                break;
            default:
                if (byte < 0x80) {
                    AppendUnit(out, byte);
                    break;
                }
                {
                    // Valid UTF-8 by contract: the lead byte gives the length (cut at the end
                    // all the same, so a broken string cannot make the walk overrun).
                    const ptrdiff_t lead = byte >= 0xF0 ? 4 : byte >= 0xE0 ? 3 : 2;
                    const int length = static_cast<int>(std::min(lead, end - text));
                    unsigned c = byte & (0x7F >> length);
                    for (int i = 1; i < length; ++i) {
                        c = (c << 6) | (static_cast<unsigned char>(text[i]) & 0x3F);
                    }
                    text += length - 1;
                    if (c < 0x10000) {
                        AppendUnit(out, c);
                    } else {
                        AppendUnit(out, 0xD800 + ((c - 0x10000) >> 10));
                        AppendUnit(out, 0xDC00 + ((c - 0x10000) & 0x3FF));
                    }
                }
        }
        ++text;
    }
    out += '"';
}

void AppendDouble(std::string &out, double value) {
    if (!isfinite(value)) {
        out += isnan(value) ? "null" : value < 0 ? "-1e+9999" : "1e+9999";
        return;
    }
    char buf[40];
    const int length = snprintf(buf, sizeof buf, "%.17g", value);
    const std::string text(buf, static_cast<size_t>(length));
    out += text;
    if (text.find_first_of(".e") == std::string::npos) {
        out += ".0";
    }
}

}  // namespace

void AppendJson(std::string &out, const Json::Value &value) {
    switch (value.type()) {
        case Json::nullValue:
            out += "null";
            break;
        case Json::intValue:
            out += std::to_string(value.asLargestInt());
            break;
        case Json::uintValue:
            out += std::to_string(value.asLargestUInt());
            break;
        case Json::realValue:
            AppendDouble(out, value.asDouble());
            break;
        case Json::booleanValue:
            out += value.asBool() ? "true" : "false";
            break;
        case Json::stringValue: {
            const char *begin = nullptr;
            const char *end = nullptr;
            value.getString(&begin, &end);
            AppendQuoted(out, begin, end);
            break;
        }
        case Json::arrayValue: {
            out += '[';
            for (Json::ArrayIndex i = 0; i < value.size(); ++i) {
                if (i != 0)
                    out += ',';
                AppendJson(out, value[i]);
            }
            out += ']';
            break;
        }
        case Json::objectValue: {
            out += '{';
            bool first = true;
            for (auto member = value.begin(); member != value.end(); ++member) {
                if (!first)
                    out += ',';
                first = false;
                const char *end = nullptr;
                const char *name = member.memberName(&end);
                AppendQuoted(out, name, end);
                out += ':';
                AppendJson(out, *member);
            }
            out += '}';
            break;
        }
    }
}

}  // namespace norvo::cli
