// The CGI request: the login sid (the cookie "id" and the query parameter "_sid") and every
// parameter and cookie of QUIB::WebCGI, each against a character-by-character reading of the
// rules; parsed parameters encode back to what parses to them again, and pairs of any bytes
// but NUL survive the encoder and the parser; a cookie handed out is always a token.
//
// Input: the Cookie header, a newline, the query string (to the next newline for WebCGI, whose
// POST body is the rest). The parsers see views of exactly the input bytes, so a read past
// either end is an ASan report.
#include <ctype.h>
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>
#include <sys/mman.h>
#include <unistd.h>

#include <string>
#include <string_view>
#include <vector>

#include "cgi_request.h"
#include "quib_cgi.h"

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

// '+' is a space, "%hh" a byte; a '%' without two hex digits, "%00" or a raw NUL spoils the text.
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
            if (text[i] == '\0') {
                return false;
            }
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

using Pairs = norvo::platform::NameValues;

// Every piece between '&' that is not empty, both halves decoded; false when one does not decode.
bool FormOf(std::string_view text, Pairs *pairs) {
    pairs->clear();
    for (const std::string &piece : Pieces(text, '&')) {
        if (piece.empty()) {
            continue;
        }
        const size_t equals = piece.find('=');
        std::string name, value;
        if (!Decoded(piece.substr(0, equals), &name) ||
            !Decoded(equals == std::string::npos ? std::string() : piece.substr(equals + 1), &value)) {
            pairs->clear();
            return false;
        }
        pairs->emplace_back(name, value);
    }
    return true;
}

// The plainest encoder: every byte but letters and digits as %XX (a space as '+' when plus).
std::string Encoded(const std::string &text, bool plus) {
    std::string out;
    for (unsigned char c : text) {
        if (isalnum(c)) {
            out += static_cast<char>(c);
        } else if (c == ' ' && plus) {
            out += '+';
        } else {
            out += '%';
            out += "0123456789ABCDEF"[c >> 4];
            out += "0123456789abcdef"[c & 15];
        }
    }
    return out;
}

std::string EncodedForm(const Pairs &pairs, bool plus) {
    std::string out;
    for (const auto &[name, value] : pairs) {
        out += (out.empty() ? "" : "&") + Encoded(name, plus) + "=" + Encoded(value, plus);
    }
    return out;
}

void CheckForm(std::string_view text) {
    Pairs got, want, again;
    const bool ok = norvo::platform::ParseUrlEncoded(text, &got);
    Check(ok == FormOf(text, &want) && got == want);
    for (const auto &[name, value] : got) {
        Check(name.find('\0') == std::string::npos && value.find('\0') == std::string::npos);
    }
    Check(norvo::platform::ParseUrlEncoded(EncodedForm(got, text.size() % 2 == 0), &again) && again == got);

    // The input as pairs of any bytes but NUL (0x01 between pairs, 0x02 between name and value).
    Pairs made;
    for (const std::string &pair : Pieces(text, '\x01')) {
        std::string clean;
        for (char c : pair) {
            if (c != '\0')
                clean += c;
        }
        const size_t cut = clean.find('\x02');
        made.emplace_back(clean.substr(0, cut), cut == std::string::npos ? "" : clean.substr(cut + 1));
    }
    Check(norvo::platform::ParseUrlEncoded(EncodedForm(made, text.size() % 3 == 0), &again) && again == made);
}

// The whole request through QUIB::WebCGI: a POST of the body with the query and the cookies.
void CheckWebCgi(const std::string &cookie, const std::string &query, std::string_view body) {
    static const int bodyFd = memfd_create("body", 0);
    Check(bodyFd >= 0 && ftruncate(bodyFd, 0) == 0 &&
          pwrite(bodyFd, body.data(), body.size(), 0) == static_cast<ssize_t>(body.size()));
    lseek(bodyFd, 0, SEEK_SET);
    setenv("REQUEST_METHOD", "POST", 1);
    setenv("CONTENT_TYPE", "application/x-www-form-urlencoded", 1);
    setenv("CONTENT_LENGTH", std::to_string(body.size()).c_str(), 1);
    setenv("HTTP_COOKIE", cookie.c_str(), 1);
    setenv("QUERY_STRING", query.c_str(), 1);
    QUIB::WebCGI cgi;
    Pairs fromQuery, fromBody;
    const bool ok = FormOf(query, &fromQuery) && FormOf(body, &fromBody);
    Check((cgi.Init(bodyFd, -1) == 0) == ok);
    fromQuery.insert(fromQuery.end(), fromBody.begin(), fromBody.end());
    for (const auto &[name, value] : ok ? fromQuery : Pairs()) {
        std::string first;
        for (const auto &[n, v] : fromQuery) {
            if (n == name) {
                first = v;
                break;
            }
        }
        Check(cgi.In(name.c_str()) != nullptr && cgi.In(name.c_str()) == first);
    }
    for (const auto &[name, value] : norvo::platform::ParseCookies(cookie)) {
        Check(norvo::platform::IsToken(name));
        const char *got = cgi.GetCookie(name.c_str());
        Check(got == nullptr || (ok && norvo::platform::IsToken(got)));
    }
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

    CheckForm(query);
    const size_t bodyAt = queryEnv.find('\n');
    CheckWebCgi(cookieEnv, queryEnv.substr(0, bodyAt),
                bodyAt == std::string::npos ? std::string_view() : query.substr(bodyAt + 1));
    return 0;
}
