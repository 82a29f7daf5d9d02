// The login sid of a CGI request: the cookie "id" and the query parameter "_sid", each against a
// character-by-character reading of the rules, and the two together as the environment offers
// them.
//
// Input: the Cookie header, a newline, the query string. The parsers see views of exactly the
// input bytes, so a read past either end is an ASan report.
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>

#include <string>
#include <string_view>
#include <vector>

#include "cgi_request.h"

namespace {

void Check(bool ok) {
    if (!ok) {
        __builtin_trap();
    }
}

bool IsBlank(char c) {
    return c == ' ' || c == '\t';
}

std::string Trimmed(const std::string &text) {
    size_t begin = 0;
    size_t end = text.size();
    while (begin < end && IsBlank(text[begin])) {
        ++begin;
    }
    while (end > begin && IsBlank(text[end - 1])) {
        --end;
    }
    return text.substr(begin, end - begin);
}

// The pieces of text between separators, empty ones included.
std::vector<std::string> Pieces(std::string_view text, char separator) {
    std::vector<std::string> out(1);
    for (char c : text) {
        if (c == separator) {
            out.emplace_back();
        } else {
            out.back() += c;
        }
    }
    return out;
}

// The first cookie called name: blanks around name and value do not count, and a value in
// double quotes loses them.
bool CookieOf(std::string_view header, const std::string &name, std::string *value) {
    for (const std::string &pair : Pieces(header, ';')) {
        const size_t equals = pair.find('=');
        if (equals == std::string::npos || Trimmed(pair.substr(0, equals)) != name) {
            continue;
        }
        std::string text = Trimmed(pair.substr(equals + 1));
        if (text.size() >= 2 && text[0] == '"' && text[text.size() - 1] == '"') {
            text = text.substr(1, text.size() - 2);
        }
        *value = text;
        return true;
    }
    return false;
}

int Hex(char c) {
    const std::string digits = "0123456789abcdef";
    const size_t at = digits.find(static_cast<char>(c >= 'A' && c <= 'F' ? c + 32 : c));
    return at == std::string::npos ? -1 : static_cast<int>(at);
}

// '+' is a space, "%hh" a byte; a '%' without two hex digits, or "%00", spoils the text.
bool Decoded(const std::string &text, std::string *out) {
    out->clear();
    size_t i = 0;
    while (i < text.size()) {
        if (text[i] == '%') {
            if (text.size() - i < 3 || Hex(text[i + 1]) < 0 || Hex(text[i + 2]) < 0) {
                return false;
            }
            const int byte = Hex(text[i + 1]) * 16 + Hex(text[i + 2]);
            if (byte == 0) {
                return false;
            }
            *out += static_cast<char>(byte);
            i += 3;
        } else {
            *out += text[i] == '+' ? ' ' : text[i];
            i += 1;
        }
    }
    return true;
}

// The first parameter called name whose key and value both decode; no '=' means "".
bool ParameterOf(std::string_view query, const std::string &name, std::string *value) {
    for (const std::string &pair : Pieces(query, '&')) {
        const size_t equals = pair.find('=');
        std::string key;
        if (!Decoded(pair.substr(0, equals), &key) || key != name) {
            continue;
        }
        if (Decoded(equals == std::string::npos ? std::string() : pair.substr(equals + 1), value)) {
            return true;
        }
    }
    return false;
}

void CheckCookie(std::string_view header, const std::string &name) {
    std::string got;
    std::string want;
    const bool found = norvo::platform::FindCookie(header, name, &got);
    Check(found == CookieOf(header, name, &want));
    if (found) {
        Check(got == want);
        Check(header.find(got) != std::string_view::npos);
        Check(got.find(';') == std::string::npos);
    }
}

void CheckParameter(std::string_view query, const std::string &name) {
    std::string got;
    std::string want;
    const bool found = norvo::platform::FindQueryParameter(query, name, &got);
    Check(found == ParameterOf(query, name, &want));
    if (found) {
        Check(got == want);
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    const std::string_view input(reinterpret_cast<const char *>(data), size);
    const size_t newline = input.find('\n');
    const std::string_view header = input.substr(0, newline);
    const std::string_view query =
        newline == std::string_view::npos ? std::string_view() : input.substr(newline + 1);

    CheckCookie(header, "id");
    CheckCookie(input, "a b");
    CheckParameter(query, "_sid");
    CheckParameter(input, "a b");

    // The environment holds C strings: each value ends at its first NUL.
    const std::string cookieEnv(header.substr(0, header.find('\0')));
    const std::string queryEnv(query.substr(0, query.find('\0')));
    setenv("HTTP_COOKIE", cookieEnv.c_str(), 1);
    setenv("QUERY_STRING", queryEnv.c_str(), 1);
    std::vector<std::string> want;
    std::string value;
    if (CookieOf(cookieEnv, "id", &value)) {
        want.push_back(value);
    }
    if (ParameterOf(queryEnv, "_sid", &value)) {
        want.push_back(value);
    }
    const std::vector<std::string> sids = norvo::platform::RequestSids();
    Check(sids == want);
    for (const std::string &sid : sids) {
        Check(sid.find('\0') == std::string::npos);  // it goes on as a C string
    }
    return 0;
}
