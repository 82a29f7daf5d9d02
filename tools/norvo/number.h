// Strict number arguments: the whole text must be the number.
#pragma once
#include <string>

namespace norvo::cli {

// Decimal or 0x-prefixed hexadecimal within [low, high] into *out; false for anything else
// (signs, spaces, trailing text, overflow).
bool ParseNumber(const std::string &text, int low, int high, int *out);

}  // namespace norvo::cli
