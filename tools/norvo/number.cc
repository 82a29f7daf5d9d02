#include "number.h"

namespace norvo::cli {

bool ParseNumber(const std::string &text, int low, int high, int *out) {
    const bool hex = text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X');
    const size_t start = hex ? 2 : 0;
    const long base = hex ? 16 : 10;
    if (text.size() <= start) {
        return false;
    }
    long value = 0;
    for (size_t i = start; i < text.size(); ++i) {
        const char c = text[i];
        long digit = 0;
        if (c >= '0' && c <= '9') {
            digit = c - '0';
        } else if (hex && c >= 'a' && c <= 'f') {
            digit = c - 'a' + 10;
        } else if (hex && c >= 'A' && c <= 'F') {
            digit = c - 'A' + 10;
        } else {
            return false;
        }
        value = value * base + digit;
        if (value > high) {
            return false;
        }
    }
    if (value < low) {
        return false;
    }
    *out = static_cast<int>(value);
    return true;
}

}  // namespace norvo::cli
