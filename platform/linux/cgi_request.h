// Reading the login sid of a CGI/1.1 request (RFC 3875) from its cookies or query string.
#pragma once
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace norvo::platform {

using NameValues = std::vector<std::pair<std::string, std::string>>;

// An RFC 7230 token: one or more visible ASCII characters other than the separators
// ()<>@,;:\"/[]?={}. Cookie names and values are held to it: nothing else can reach a
// Set-Cookie header or a line file through them.
[[nodiscard]] bool IsToken(std::string_view text);

// Splits an application/x-www-form-urlencoded text (a query string or a POST body) at '&' into
// percent-decoded name and value pairs, in order ('+' is a space; a piece without '=' has the
// value ""; empty pieces are skipped). false, with *pairs cleared, when any piece holds a '%'
// without two hex digits or a NUL, escaped or raw (it would cut the value short wherever it is
// used as a C string).
[[nodiscard]] bool ParseUrlEncoded(std::string_view text, NameValues *pairs);

// The cookies of a Cookie header whose names are tokens, in order, each value with blanks and
// one pair of double quotes removed (the value is not checked: a reader refuses it later).
[[nodiscard]] NameValues ParseCookies(std::string_view header);

// The value of the first cookie called name in a Cookie header ("a=1; id=xyz"), with
// surrounding blanks and one pair of double quotes removed. false when there is none.
[[nodiscard]] bool FindCookie(std::string_view header, std::string_view name, std::string *value);

// The percent-decoded value of the first parameter called name in a query string
// ("a=1&_sid=xyz"; '+' is a space). Parameters with broken escapes or an escaped NUL are
// skipped. false when there is none.
[[nodiscard]] bool FindQueryParameter(std::string_view query, std::string_view name, std::string *value);

// The sids a request offers, in the order they are tried: the cookie "id" of HTTP_COOKIE,
// then the parameter "_sid" of QUERY_STRING.
[[nodiscard]] std::vector<std::string> RequestSids();

}  // namespace norvo::platform
