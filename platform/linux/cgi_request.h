// Reading the login sid of a CGI/1.1 request (RFC 3875) from its cookies or query string.
#pragma once
#include <string>
#include <string_view>
#include <vector>

namespace norvo::platform {

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
