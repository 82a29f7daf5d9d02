#include "settings_format.h"

#include "text_util.h"

namespace norvo::platform {

namespace {

// A double-quoted value: \" and \\ are escapes, any other backslash is literal (as in sh).
// Text after the closing quote is ignored; an unterminated value runs to the end of the line.
std::string UnquoteDouble(std::string_view rest) {
    std::string out;
    for (size_t i = 1; i < rest.size(); ++i) {
        char c = rest[i];
        if (c == '"') {
            break;
        }
        if (c == '\\' && i + 1 < rest.size() && (rest[i + 1] == '"' || rest[i + 1] == '\\')) {
            out += rest[++i];
            continue;
        }
        out += c;
    }
    return out;
}

// A single-quoted value is literal up to the next quote.
std::string UnquoteSingle(std::string_view rest) {
    size_t close = rest.find('\'', 1);
    return std::string(rest.substr(1, close == std::string_view::npos ? std::string_view::npos : close - 1));
}

// The keys a reader may ask for (VLIBCFileGetKeyValue and the others refuse the rest).
bool IsAskableKey(std::string_view key) {
    if (key.empty() || key.size() > kMaxSettingsKeyLength || !IsValidUtf8(key)) {
        return false;
    }
    for (char c : key) {
        if (static_cast<unsigned char>(c) < 0x20) {
            return false;
        }
    }
    return true;
}

// A line is read up to its first NUL, as a C reader of the file would read it, so every caller
// (those handing keys and values on as C strings included) sees the same key and value.
void ParseEntry(SettingsLine *line) {
    std::string_view body = line->text;
    body = TrimSpace(body.substr(0, body.find('\0')));
    if (body.empty() || body.front() == '#') {
        return;
    }
    size_t eq = body.find('=');
    if (eq == std::string_view::npos) {
        return;  // malformed: kept as it is, never read as a key
    }
    std::string_view key = TrimSpace(body.substr(0, eq));
    if (!IsAskableKey(key)) {
        return;  // no reader could ask for it, so no listing offers it either
    }
    std::string_view rest = TrimSpace(body.substr(eq + 1));
    line->isEntry = true;
    line->key = std::string(key);
    if (!rest.empty() && rest.front() == '"') {
        line->value = UnquoteDouble(rest);
    } else if (!rest.empty() && rest.front() == '\'') {
        line->value = UnquoteSingle(rest);
    } else {
        line->value = std::string(rest);
    }
}

bool HasControl(std::string_view text, bool allowTab) {
    for (char c : text) {
        auto u = static_cast<unsigned char>(c);
        if ((u < 0x20 && !(allowTab && c == '\t')) || u == 0x7F) {
            return true;
        }
    }
    return false;
}

}  // namespace

std::vector<SettingsLine> ParseSettings(std::string_view text) {
    std::vector<SettingsLine> lines;
    size_t pos = 0;
    while (pos < text.size()) {
        size_t nl = text.find('\n', pos);
        SettingsLine line;
        if (nl == std::string_view::npos) {
            line.text = std::string(text.substr(pos));
            pos = text.size();
        } else {
            line.text = std::string(text.substr(pos, nl - pos));
            line.eol = "\n";
            pos = nl + 1;
        }
        if (!line.eol.empty() && !line.text.empty() && line.text.back() == '\r') {
            line.text.pop_back();
            line.eol = "\r\n";
        }
        ParseEntry(&line);
        lines.push_back(std::move(line));
    }
    return lines;
}

std::string RenderSettings(const std::vector<SettingsLine> &lines) {
    std::string out;
    for (const SettingsLine &line : lines) {
        out += line.text;
        out += line.eol;
    }
    return out;
}

bool IsWritableKey(std::string_view key) {
    if (key.empty() || key.size() > kMaxSettingsKeyLength || !IsValidUtf8(key) || HasControl(key, false) ||
        key.front() == '#' || key.front() == '"' || key.front() == '\'') {
        return false;
    }
    for (char c : key) {
        if (c == '=' || IsSpaceByte(c)) {
            return false;
        }
    }
    return true;
}

bool IsWritableValue(std::string_view value, int format) {
    if (value.size() > kMaxSettingsValueLength || !IsValidUtf8(value) || HasControl(value, true)) {
        return false;
    }
    if (format == 1 && !value.empty()) {
        return TrimSpace(value).size() == value.size() && value.front() != '"' && value.front() != '\'';
    }
    return true;
}

std::string FormatEntry(std::string_view key, std::string_view value, int format) {
    std::string line(key);
    line += '=';
    if (format == 1) {
        line += value;
        return line;
    }
    line += '"';
    for (char c : value) {
        if (c == '"' || c == '\\') {
            line += '\\';
        }
        line += c;
    }
    line += '"';
    return line;
}

bool KeyMatches(const SettingsLine &line, std::string_view key, bool ignoreCase) {
    if (!line.isEntry) {
        return false;
    }
    return ignoreCase ? EqualsIgnoreCase(line.key, key) : line.key == key;
}

const SettingsLine *FindSettingsEntry(const std::vector<SettingsLine> &lines, std::string_view key,
                                      bool ignoreCase) {
    for (const SettingsLine &line : lines) {
        if (KeyMatches(line, key, ignoreCase)) {
            return &line;
        }
    }
    return nullptr;
}

}  // namespace norvo::platform
