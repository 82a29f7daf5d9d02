// Byte-level text conversions and checks: lower-casing, the UTF-8 form test, hex decoding.
#include <ctype.h>
#include <stdlib.h>
#include <string.h>

#include <string>

#include "errors/guard.h"
#include "norvo/norvomisc.h"

int NvoLibStringToLower(char *text) {
    if (text == nullptr) {
        return -1;
    }
    for (char *c = text; *c != '\0'; ++c) {
        *c = static_cast<char>(tolower(static_cast<unsigned char>(*c)));
    }
    return 0;
}

// The lead-byte rules of the original UTF-8 definition: forms of up to six bytes pass, and
// overlong forms and surrogates are not rejected (intended: names already on disk must pass).
int IsUnicodeString(const char *text) {
    if (text == nullptr) {
        return 1;
    }
    int pending = 0;
    for (const unsigned char *c = reinterpret_cast<const unsigned char *>(text); *c != 0; ++c) {
        if (pending > 0) {
            if ((*c & 0xC0) != 0x80) {
                return 0;
            }
            --pending;
        } else if (*c >= 0x80) {
            if ((*c & 0xE0) == 0xC0) {
                pending = 1;
            } else if ((*c & 0xF0) == 0xE0) {
                pending = 2;
            } else if ((*c & 0xF8) == 0xF0) {
                pending = 3;
            } else if ((*c & 0xFC) == 0xF8) {
                pending = 4;
            } else if ((*c & 0xFE) == 0xFC) {
                pending = 5;
            } else {
                return 0;
            }
        }
    }
    return pending == 0 ? 1 : 0;
}

// Each pair goes through strtol, so its quirks are kept: leading blanks or a sign count and
// parsing stops at the first non-hex character ("4g" gives 4).
std::string NvoLibHex2Bin(const char *hex) {
    return norvo::Guarded<std::string>(std::string(), [&]() -> std::string {
        std::string out;
        if (hex == nullptr) {
            return out;
        }
        const size_t pairs = strlen(hex) / 2;
        for (size_t i = 0; i < pairs; ++i) {
            const char two[3] = {hex[2 * i], hex[2 * i + 1], '\0'};
            const char byte = static_cast<char>(strtol(two, nullptr, 16));
            if (byte == '\0') {
                break;  // the decoded bytes are read back as a C string
            }
            out += byte;
        }
        return out;
    });
}
