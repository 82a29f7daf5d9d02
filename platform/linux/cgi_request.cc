// Cookie and query-string parsing of CGI requests.
#include "cgi_request.h"

#include <stdlib.h>

namespace norvo::platform {
namespace {

std::string_view TrimBlanks(std::string_view text) {
    const size_t first = text.find_first_not_of(" \t");
    if (first == std::string_view::npos) {
        return std::string_view();
    }
    const size_t last = text.find_last_not_of(" \t");
    return text.substr(first, last - first + 1);
}

int HexValue(char c) {
    if (c >= '0' && c <= '9') {
        return c - '0';
    }
    if (c >= 'a' && c <= 'f') {
        return c - 'a' + 10;
    }
    if (c >= 'A' && c <= 'F') {
        return c - 'A' + 10;
    }
    return -1;
}

bool PercentDecode(std::string_view text, std::string *out) {
    out->clear();
    for (size_t i = 0; i < text.size(); ++i) {
        if (text[i] == '\0') {
            return false;  // as an escaped one below
        } else if (text[i] == '+') {
            *out += ' ';
        } else if (text[i] != '%') {
            *out += text[i];
        } else {
            const int high = i + 2 < text.size() ? HexValue(text[i + 1]) : -1;
            const int low = high >= 0 ? HexValue(text[i + 2]) : -1;
            // A NUL would cut the value short wherever it is later used as a C string.
            if (low < 0 || (high == 0 && low == 0)) {
                return false;
            }
            *out += static_cast<char>(high * 16 + low);
            i += 2;
        }
    }
    return true;
}

}  // namespace

bool IsToken(std::string_view text) {
    constexpr std::string_view kSeparators = "()<>@,;:\\\"/[]?={}";
    for (const char c : text) {
        if (c <= ' ' || c >= 0x7F || kSeparators.find(c) != std::string_view::npos) {
            return false;
        }
    }
    return !text.empty();
}

bool ParseUrlEncoded(std::string_view text, NameValues *pairs) {
    pairs->clear();
    size_t pos = 0;
    while (pos < text.size()) {
        size_t end = text.find('&', pos);
        if (end == std::string_view::npos) {
            end = text.size();
        }
        const std::string_view piece = text.substr(pos, end - pos);
        pos = end + 1;
        if (piece.empty()) {
            continue;
        }
        const size_t equals = piece.find('=');
        std::string name;
        std::string value;
        if (!PercentDecode(piece.substr(0, equals), &name) ||
            (equals != std::string_view::npos && !PercentDecode(piece.substr(equals + 1), &value))) {
            pairs->clear();
            return false;
        }
        pairs->emplace_back(std::move(name), std::move(value));
    }
    return true;
}

NameValues ParseCookies(std::string_view header) {
    NameValues cookies;
    size_t pos = 0;
    while (pos < header.size()) {
        size_t end = header.find(';', pos);
        if (end == std::string_view::npos) {
            end = header.size();
        }
        const std::string_view pair = header.substr(pos, end - pos);
        pos = end + 1;
        const size_t equals = pair.find('=');
        const std::string_view name = TrimBlanks(pair.substr(0, equals));
        if (equals == std::string_view::npos || !IsToken(name)) {
            continue;
        }
        std::string_view value = TrimBlanks(pair.substr(equals + 1));
        if (value.size() >= 2 && value.front() == '"' && value.back() == '"') {
            value = value.substr(1, value.size() - 2);
        }
        cookies.emplace_back(name, value);
    }
    return cookies;
}

bool FindCookie(std::string_view header, std::string_view name, std::string *value) {
    size_t pos = 0;
    while (pos <= header.size()) {
        size_t end = header.find(';', pos);
        if (end == std::string_view::npos) {
            end = header.size();
        }
        const std::string_view pair = header.substr(pos, end - pos);
        pos = end + 1;
        const size_t equals = pair.find('=');
        if (equals == std::string_view::npos || TrimBlanks(pair.substr(0, equals)) != name) {
            continue;
        }
        std::string_view text = TrimBlanks(pair.substr(equals + 1));
        if (text.size() >= 2 && text.front() == '"' && text.back() == '"') {
            text = text.substr(1, text.size() - 2);
        }
        value->assign(text);
        return true;
    }
    return false;
}

bool FindQueryParameter(std::string_view query, std::string_view name, std::string *value) {
    size_t pos = 0;
    std::string key;
    while (pos <= query.size()) {
        size_t end = query.find('&', pos);
        if (end == std::string_view::npos) {
            end = query.size();
        }
        const std::string_view pair = query.substr(pos, end - pos);
        pos = end + 1;
        const size_t equals = pair.find('=');
        const std::string_view rawKey = pair.substr(0, equals);
        if (!PercentDecode(rawKey, &key) || key != name) {
            continue;
        }
        const std::string_view rawValue =
            equals == std::string_view::npos ? std::string_view() : pair.substr(equals + 1);
        if (PercentDecode(rawValue, value)) {
            return true;
        }
    }
    return false;
}

std::vector<std::string> RequestSids() {
    std::vector<std::string> sids;
    std::string value;
    if (const char *cookie = getenv("HTTP_COOKIE"); cookie != nullptr && FindCookie(cookie, "id", &value)) {
        sids.push_back(value);
    }
    if (const char *query = getenv("QUERY_STRING");
        query != nullptr && FindQueryParameter(query, "_sid", &value)) {
        sids.push_back(value);
    }
    return sids;
}

}  // namespace norvo::platform
