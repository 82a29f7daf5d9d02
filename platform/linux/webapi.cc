// QUIB::WebAPIUtil: request values the web interface sends as comma-separated lists.
#include <string.h>

#include "api_guard.h"
#include "quib_webapi.h"

namespace QUIB {

int WebAPIUtil::ParseToArray(const char *value, Json::Value &array) {
    if (value == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return norvo::platform::Guarded(-1, [&] {
        Json::Value pieces(Json::arrayValue);
        const char *start = value;
        for (;;) {
            const char *comma = strchr(start, ',');
            const char *end = comma != nullptr ? comma : start + strlen(start);
            pieces.append(Json::Value(start, end));
            if (comma == nullptr) {
                break;
            }
            start = comma + 1;
        }
        array.swap(pieces);
        return 0;
    });
}

}  // namespace QUIB
