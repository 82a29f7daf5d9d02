// How VLIBCUnicodeUTF8LikeMatch reads a character, shared with the volume index, whose trigrams
// must fold names exactly as the matcher does.
#pragma once
#include <stdint.h>

#include <unicode/utf8.h>

namespace norvo::platform {

// One character at *text. A byte 0xC0..0xF4 leads as many trail bytes as ICU's trail-byte table
// gives (0xC0 and 0xC1 count one, as the older table had it; newer ICU no longer calls them lead
// bytes), taken unvalidated; any other byte stands alone. A sequence cut short by the terminating
// NUL ends there, so nothing past it is ever read. Returns the byte after the character.
inline const uint8_t *DecodeLikeChar(const uint8_t *text, UChar32 *c) {
    UChar32 value = *text++;
    if (value < 0xC0 || value > 0xF4) {
        *c = value;
        return text;
    }
    const int trail = value >= 0xC2 ? U8_COUNT_TRAIL_BYTES(value) : 1;
    value &= (1 << (6 - trail)) - 1;
    for (int i = 0; i < trail && *text != 0; ++i) {
        value = (value << 6) | (*text++ & 0x3F);
    }
    *c = value;
    return text;
}

}  // namespace norvo::platform
