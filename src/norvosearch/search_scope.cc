#include "norvosearch/search_scope.h"

#include "quib_fs.h"
#include "quib_share.h"

namespace norvo::search {

bool OutOfSight(const std::string &root, const std::string &rest) {
    size_t start = 0;
    for (int level = 0; start <= rest.size() && !rest.empty(); ++level) {
        size_t end = rest.find('/', start);
        end = end == std::string::npos ? rest.size() : end;
        const std::string name = rest.substr(start, end - start);
        if (!name.empty() && QUIBEAIsHiddenFile(name.c_str()) != 0) {
            return true;
        }
        if (level < 2 && QUIBShareIsShareRecycle((root + "/" + rest.substr(0, end)).c_str()) == 1) {
            return true;
        }
        start = end + 1;
    }
    return false;
}

std::string BelowPattern(const std::string &rest) {
    if (rest.empty()) {
        return "*";
    }
    std::string pattern;
    for (const char c : rest) {
        if (c == '*' || c == '\\') {
            pattern += '\\';
        }
        pattern += c;
    }
    return pattern + "/*";
}

}  // namespace norvo::search
