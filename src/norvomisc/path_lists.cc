// Lists of paths: joined for display, and their common parent directory.
#include <algorithm>
#include <string>
#include <vector>

#include <json/value.h>

#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvomisc.h"

using norvo::kNorvoMisc;

namespace {

// An element's text; arrays and objects have none (jsoncpp would throw on asking).
std::string ElementText(const Json::Value &element) {
    return element.isConvertibleTo(Json::stringValue) ? element.asString() : std::string();
}

}  // namespace

int ParseJsonPathToString(const Json::Value &value, std::string &out) {
    return norvo::Guarded<int>(0, [&]() -> int {
        if (!value.isArray()) {
            NvoLibSetErr(NVO_ERR_SYSTEM);
            NVO_LOG(kNorvoMisc, "%s:%d Wrong JSON format");
            return 0;
        }
        out.clear();
        for (const Json::Value &element : value) {
            const std::string text = ElementText(element);
            const size_t slash = text.find('/');
            if (!out.empty()) {
                out += ", ";
            }
            out.append(text, slash == std::string::npos ? 0 : slash, std::string::npos);
        }
        return 1;
    });
}

// Paths without any common leading directory leave their common prefix as it is ("ab" and
// "ac" give "a"): intended.
std::string FindCommonParent(std::vector<std::string> paths) {
    return norvo::Guarded<std::string>(std::string(), [&]() -> std::string {
        size_t longest = 0;
        for (std::string &path : paths) {
            if (!path.empty() && path.back() != '/') {
                path += '/';
            }
            longest = std::max(longest, path.size());
        }
        if (longest == 0) {
            return std::string();
        }
        // A path that has ended compares as its terminating NUL, so it differs from the longest.
        const auto at = [](const std::string &path, size_t i) { return i < path.size() ? path[i] : '\0'; };
        size_t common = 0;
        for (; common < longest; ++common) {
            const char c = at(paths.front(), common);
            if (!std::all_of(paths.begin(), paths.end(),
                             [&](const std::string &path) { return at(path, common) == c; })) {
                break;
            }
        }
        std::string parent = paths.front().substr(0, common);
        if (!parent.empty() && parent.back() != '/') {
            const size_t slash = parent.rfind('/');
            if (slash != std::string::npos) {
                parent.erase(slash + 1);
            }
        }
        return parent;
    });
}
