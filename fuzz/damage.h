// What the fail-closed fuzzers of configuration files share: the fuzzer's bytes read one at a
// time, and the bytes that damage a value.
#pragma once
#include <stddef.h>
#include <stdint.h>

#include <string>

namespace norvo::fuzz {

class Input {
public:
    Input(const uint8_t *data, size_t size) : data_(data), size_(size) {}
    uint8_t Byte() { return pos_ < size_ ? data_[pos_++] : 0; }
    bool Empty() const { return pos_ >= size_; }

private:
    const uint8_t *data_;
    size_t size_;
    size_t pos_ = 0;
};

// A byte that damages: a control character (tab and line breaks aside: a tab is a separator and
// a line break ends the value), DEL, a double quote (the quote of lists), or a lone byte above
// 0x7F. A single quote is not: inside a name it is an ordinary character.
inline char DamageByte(uint8_t pick) {
    static const std::string alphabet = [] {
        std::string bytes;
        for (int c = 0; c < 0x20; ++c) {
            if (c != '\t' && c != '\n' && c != '\r') {
                bytes += static_cast<char>(c);
            }
        }
        bytes += "\x7f\"";
        for (int c = 0x80; c <= 0xFF; c += 9) {
            bytes += static_cast<char>(c);
        }
        return bytes;
    }();
    return alphabet[pick % alphabet.size()];
}

}  // namespace norvo::fuzz
