// Accept-Language against a slow, plainly written reading of the rules: the language chosen is
// always one the interface has, and the one the reference picks.
//
// Input: the header's bytes.
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>

#include <regex>
#include <string>
#include <vector>

#include "accept_language.h"

namespace {

const std::vector<std::string> kAvailable = {"en", "de", "de-ch-x", "fr", "zh-tw", "pt-br"};

std::string Lower(std::string s) {
    for (char &c : s) {
        c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
    }
    return s;
}

bool StartsWith(const std::string &s, const std::string &prefix) {
    return s.compare(0, prefix.size(), prefix) == 0;
}

// The tag a range takes: the longest tag it equals or extends by "-..."; else the first tag
// that extends the range by "-...".
std::string Taken(const std::string &range) {
    std::string best;
    for (const std::string &tag : kAvailable) {
        if ((range == tag || StartsWith(range, tag + "-")) && tag.size() > best.size()) {
            best = tag;
        }
    }
    if (best.empty()) {
        for (const std::string &tag : kAvailable) {
            if (StartsWith(tag, range + "-")) {
                return tag;
            }
        }
    }
    return best;
}

std::string Reference(std::string header) {
    static const std::regex element(
        "[ \t]*(\\*|[A-Za-z]{1,8}(-[A-Za-z0-9]{1,8})*)[ \t]*(;[ \t]*[qQ]=(0(\\.[0-9]{0,3})?|1(\\.0{0,3})?))?[ \t]*");
    header = header.substr(0, 4096);
    std::vector<std::pair<std::string, int>> wanted;
    size_t start = 0;
    while (start <= header.size() && wanted.size() < 64) {
        size_t comma = header.find(',', start);
        if (comma == std::string::npos) {
            comma = header.size();
        }
        std::smatch m;
        const std::string piece = header.substr(start, comma - start);
        if (std::regex_match(piece, m, element)) {
            const int q =
                m[4].matched ? static_cast<int>(strtod(m[4].str().c_str(), nullptr) * 1000 + 0.5) : 1000;
            if (q > 0) {
                wanted.emplace_back(Lower(m[1].str()), q);
            }
        }
        start = comma + 1;
    }
    for (int q = 1000; q > 0; --q) {
        for (const auto &[range, weight] : wanted) {
            if (weight != q) {
                continue;
            }
            if (range == "*") {
                return "en";
            }
            if (std::string tag = Taken(range); !tag.empty()) {
                return tag;
            }
        }
    }
    return "en";
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    const std::string header(reinterpret_cast<const char *>(data), size);
    const std::string chosen = norvo::platform::SelectLanguage(header, kAvailable, "en");
    if (chosen != Reference(header)) {
        abort();
    }
    return 0;
}
