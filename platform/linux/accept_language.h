// Accept-Language (RFC 9110, 12.5.4) against the languages an interface has.
#pragma once
#include <string>
#include <string_view>
#include <vector>

namespace norvo::platform {

// The first of available (lower-case tags) that the header's ranges ask for, highest q-value
// first (equal ones in header order): a range equal to a tag, a range cut at a "-" equal to one
// ("de-ch" takes "de"), or a tag beginning with the range and "-" ("zh" takes "zh-tw"). "*"
// and anything unmatched give fallback; q=0 and malformed elements are ignored. Cost is bounded:
// the first 4096 bytes and 64 elements are read.
std::string SelectLanguage(std::string_view header, const std::vector<std::string> &available,
                           const std::string &fallback);

}  // namespace norvo::platform
