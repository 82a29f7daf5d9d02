// QuibCgiSelectDefLang: the request's language among those of the web interface; the parser
// of Accept-Language behind it.
#include "accept_language.h"

#include <dirent.h>
#include <stdlib.h>

#include <algorithm>
#include <memory>

#include "api_guard.h"
#include "quib_cgi.h"

namespace norvo::platform {
namespace {

constexpr size_t kMaxHeader = 4096;
constexpr size_t kMaxElements = 64;
constexpr char kTextsRoot[] = "/usr/quib/quibman/webman/texts";
constexpr char kDefaultLanguage[] = "en";

bool IsAlpha(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}
bool IsDigit(char c) {
    return c >= '0' && c <= '9';
}

std::string_view Trim(std::string_view s) {
    while (!s.empty() && (s.front() == ' ' || s.front() == '\t')) {
        s.remove_prefix(1);
    }
    while (!s.empty() && (s.back() == ' ' || s.back() == '\t')) {
        s.remove_suffix(1);
    }
    return s;
}

// A language range: "*" or 1*8ALPHA *("-" 1*8alphanum), lower-cased into *out.
bool ParseRange(std::string_view s, std::string *out) {
    if (s == "*") {
        *out = "*";
        return true;
    }
    size_t part = 0;
    bool first = true;
    out->clear();
    for (char c : s) {
        if (c == '-') {
            if (part == 0) {
                return false;
            }
            part = 0;
            first = false;
            out->push_back('-');
            continue;
        }
        if (!(IsAlpha(c) || (!first && IsDigit(c))) || ++part > 8) {
            return false;
        }
        out->push_back(static_cast<char>(c | 0x20));
    }
    return part > 0;
}

// qvalue = ( "0" [ "." 0*3DIGIT ] ) / ( "1" [ "." 0*3("0") ] ), as thousandths.
bool ParseQ(std::string_view s, int *q) {
    if (s.empty() || (s[0] != '0' && s[0] != '1')) {
        return false;
    }
    int value = (s[0] - '0') * 1000;
    if (s.size() > 1) {
        if (s[1] != '.' || s.size() > 5) {
            return false;
        }
        int scale = 100;
        for (char c : s.substr(2)) {
            if (!IsDigit(c) || (value == 1000 && c != '0')) {
                return false;
            }
            value += (c - '0') * scale;
            scale /= 10;
        }
    }
    *q = value;
    return true;
}

struct Wanted {
    std::string range;
    int q;
};

std::string Match(const std::string &range, const std::vector<std::string> &available) {
    for (std::string cut = range;;) {
        if (std::find(available.begin(), available.end(), cut) != available.end()) {
            return cut;
        }
        const size_t dash = cut.rfind('-');
        if (dash == std::string::npos) {
            break;
        }
        cut.erase(dash);
    }
    for (const std::string &tag : available) {
        if (tag.size() > range.size() && tag.compare(0, range.size(), range) == 0 &&
            tag[range.size()] == '-') {
            return tag;
        }
    }
    return "";
}

std::vector<std::string> InterfaceLanguages() {
    std::vector<std::string> found{kDefaultLanguage};
    std::unique_ptr<DIR, int (*)(DIR *)> dir(opendir(kTextsRoot), closedir);
    if (!dir) {
        return found;
    }
    while (const struct dirent *entry = readdir(dir.get())) {
        std::string tag;
        // Only folders named as a lower-case tag count: a name is a language, never a path.
        if (entry->d_type == DT_DIR && ParseRange(entry->d_name, &tag) && tag == entry->d_name &&
            tag != "*" && tag != kDefaultLanguage) {
            found.push_back(tag);
        }
    }
    std::sort(found.begin() + 1, found.end());
    return found;
}

}  // namespace

std::string SelectLanguage(std::string_view header, const std::vector<std::string> &available,
                           const std::string &fallback) {
    header = header.substr(0, kMaxHeader);
    std::vector<Wanted> wanted;
    while (!header.empty() && wanted.size() < kMaxElements) {
        const size_t comma = header.find(',');
        std::string_view element = Trim(header.substr(0, comma));
        header = comma == std::string_view::npos ? std::string_view() : header.substr(comma + 1);
        const size_t semi = element.find(';');
        Wanted w{"", 1000};
        if (!ParseRange(Trim(element.substr(0, semi)), &w.range)) {
            continue;
        }
        if (semi != std::string_view::npos) {
            std::string_view param = Trim(element.substr(semi + 1));
            if (param.size() < 2 || (param[0] != 'q' && param[0] != 'Q') || param[1] != '=' ||
                !ParseQ(param.substr(2), &w.q)) {
                continue;
            }
        }
        if (w.q > 0) {
            wanted.push_back(std::move(w));
        }
    }
    std::stable_sort(wanted.begin(), wanted.end(),
                     [](const Wanted &a, const Wanted &b) { return a.q > b.q; });
    for (const Wanted &w : wanted) {
        if (w.range == "*") {
            return fallback;
        }
        if (std::string tag = Match(w.range, available); !tag.empty()) {
            return tag;
        }
    }
    return fallback;
}

}  // namespace norvo::platform

extern "C" const char *QuibCgiSelectDefLang(void) {
    static thread_local std::string chosen;
    return norvo::platform::Guarded(static_cast<const char *>("en"), [] {
        const char *header = getenv("HTTP_ACCEPT_LANGUAGE");
        chosen = norvo::platform::SelectLanguage(header != nullptr ? header : "",
                                                 norvo::platform::InterfaceLanguages(), "en");
        return chosen.c_str();
    });
}
