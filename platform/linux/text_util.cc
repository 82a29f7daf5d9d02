#include "text_util.h"

#include <stdlib.h>
#include <string.h>

#include <vector>

namespace norvo::platform {

bool IsSpaceByte(char c) {
    return c == ' ' || c == '\t' || c == '\r' || c == '\n' || c == '\v' || c == '\f';
}

std::string_view TrimSpace(std::string_view text) {
    while (!text.empty() && IsSpaceByte(text.front())) {
        text.remove_prefix(1);
    }
    while (!text.empty() && IsSpaceByte(text.back())) {
        text.remove_suffix(1);
    }
    return text;
}

namespace {

char LowerAscii(char c) {
    return (c >= 'A' && c <= 'Z') ? static_cast<char>(c - 'A' + 'a') : c;
}

}  // namespace

std::string ToLowerAscii(std::string_view text) {
    std::string out(text);
    for (char &c : out) {
        c = LowerAscii(c);
    }
    return out;
}

bool EqualsIgnoreCase(std::string_view a, std::string_view b) {
    if (a.size() != b.size()) {
        return false;
    }
    for (size_t i = 0; i < a.size(); ++i) {
        if (LowerAscii(a[i]) != LowerAscii(b[i])) {
            return false;
        }
    }
    return true;
}

bool IsValidUtf8(std::string_view text) {
    const auto *p = reinterpret_cast<const unsigned char *>(text.data());
    const unsigned char *end = p + text.size();
    while (p < end) {
        unsigned char c = *p;
        if (c < 0x80) {
            ++p;
            continue;
        }
        size_t len = 0;
        unsigned int cp = 0;
        unsigned int min = 0;
        if ((c & 0xE0) == 0xC0) {
            len = 2;
            cp = c & 0x1F;
            min = 0x80;
        } else if ((c & 0xF0) == 0xE0) {
            len = 3;
            cp = c & 0x0F;
            min = 0x800;
        } else if ((c & 0xF8) == 0xF0) {
            len = 4;
            cp = c & 0x07;
            min = 0x10000;
        } else {
            return false;
        }
        if (static_cast<size_t>(end - p) < len) {
            return false;
        }
        for (size_t i = 1; i < len; ++i) {
            if ((p[i] & 0xC0) != 0x80) {
                return false;
            }
            cp = (cp << 6) | (p[i] & 0x3F);
        }
        if (cp < min || cp > 0x10FFFF || (cp >= 0xD800 && cp <= 0xDFFF)) {
            return false;
        }
        p += len;
    }
    return true;
}

bool IsCleanConfigText(std::string_view text) {
    for (char c : text) {
        const auto u = static_cast<unsigned char>(c);
        if ((u < 0x20 && c != '\t') || u == 0x7F) {
            return false;
        }
    }
    return IsValidUtf8(text);
}

bool IsAcceptableName(const char *name) {
    if (name == nullptr || name[0] == '\0') {
        return false;
    }
    size_t len = strnlen(name, kMaxNameLength + 1);
    if (len > kMaxNameLength) {
        return false;
    }
    std::string_view view(name, len);
    for (char c : view) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F) {
            return false;
        }
    }
    return IsValidUtf8(view);
}

bool ParseBool(std::string_view text, bool *value) {
    std::string word = ToLowerAscii(TrimSpace(text));
    if (word == "yes" || word == "true" || word == "on" || word == "1") {
        *value = true;
        return true;
    }
    if (word == "no" || word == "false" || word == "off" || word == "0") {
        *value = false;
        return true;
    }
    return false;
}

std::string NormalizePath(std::string_view path) {
    if (path.empty() || path.front() != '/') {
        return std::string();
    }
    std::vector<std::string_view> parts;
    size_t pos = 0;
    while (pos < path.size()) {
        size_t slash = path.find('/', pos);
        if (slash == std::string_view::npos) {
            slash = path.size();
        }
        std::string_view part = path.substr(pos, slash - pos);
        pos = slash + 1;
        if (part.empty() || part == ".") {
            continue;
        }
        if (part == "..") {
            if (!parts.empty()) {
                parts.pop_back();
            }
            continue;
        }
        parts.push_back(part);
    }
    if (parts.empty()) {
        return "/";
    }
    std::string out;
    for (std::string_view part : parts) {
        out += '/';
        out += part;
    }
    return out;
}

bool PathIsWithin(std::string_view root, std::string_view path) {
    if (root == "/") {
        return !path.empty() && path.front() == '/';
    }
    if (path.size() < root.size() || path.compare(0, root.size(), root) != 0) {
        return false;
    }
    return path.size() == root.size() || path[root.size()] == '/';
}

char *DupCString(std::string_view text) {
    char *copy = static_cast<char *>(malloc(text.size() + 1));
    if (copy != nullptr) {
        memcpy(copy, text.data(), text.size());
        copy[text.size()] = '\0';
    }
    return copy;
}

}  // namespace norvo::platform
