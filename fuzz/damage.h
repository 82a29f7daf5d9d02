// What the fail-closed fuzzers of configuration files share: the fuzzer's bytes read one at a
// time, and the bytes that damage a value.
#pragma once
#include <stddef.h>
#include <stdint.h>

#include <map>
#include <string>
#include <utility>
#include <vector>

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

// text with some of its values damaged, at most one byte each (two quotes, or two high bytes,
// could be an edit). values: where each value lies in text, as (start, length).
inline std::string DamageValues(const std::string &text, const std::vector<std::pair<size_t, size_t>> &values,
                                Input *in) {
    std::map<size_t, std::pair<size_t, std::string>> edits;  // by start, applied back to front
    while (!in->Empty() && !values.empty()) {
        const auto &[start, length] = values[in->Byte() % values.size()];
        const size_t at = in->Byte() % (length + 1);
        const uint8_t how = in->Byte();
        if (edits.count(start) != 0) {
            continue;
        }
        std::string value = text.substr(start, length);
        if ((how & 1) != 0 && at < length) {
            value[at] = DamageByte(how >> 1);
        } else {
            value.insert(at, 1, DamageByte(how >> 1));
        }
        edits[start] = {length, value};
    }
    std::string damaged = text;
    for (auto it = edits.rbegin(); it != edits.rend(); ++it) {
        damaged.replace(it->first, it->second.first, it->second.second);
    }
    return damaged;
}

}  // namespace norvo::fuzz
