// Helpers of the web API for request values.
#pragma once
#include <json/value.h>

#include "platform_export.h"

namespace QUIB {

class QUIB_API WebAPIUtil {
public:
    // Splits value at every "," into array, which becomes a JSON array of the pieces as strings,
    // in order and untrimmed; empty pieces are kept ("a,,b" gives "a", "", "b"; "" gives one
    // empty string). Bytes are copied as they are (text that is not UTF-8 included). 0 on
    // success; -1 with array untouched and the error slot set: 0x0D00 for a null value, 0x2B00
    // when out of memory.
    static int ParseToArray(const char *value, Json::Value &array);
};

}  // namespace QUIB
