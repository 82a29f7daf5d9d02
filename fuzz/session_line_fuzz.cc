// The session file's lines as authorisation reads them: the pieces are those fgets gives, and a
// line is taken by the fast path (carried over byte for byte) exactly when the plain strtok
// reading gives eight fields that rewrite to the same bytes, with the same fields; numbers read
// as atol reads them.
//
// Input: the session file's text.
#include <stddef.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <string>
#include <vector>

#include "norvologin/session_file.h"

namespace {

using norvo::login::kLineBuffer;

std::vector<std::string> FgetsPieces(const std::string &text) {
    std::vector<std::string> pieces;
    FILE *in = fmemopen(const_cast<char *>(text.data()), text.size(), "r");
    if (in == nullptr) {
        abort();
    }
    // fgets stops at no NUL, so the piece's length is where the next read starts.
    for (long before = 0;; before = ftell(in)) {
        char buf[kLineBuffer];
        if (fgets(buf, sizeof buf, in) == nullptr) {
            break;
        }
        pieces.push_back(text.substr(static_cast<size_t>(before), static_cast<size_t>(ftell(in) - before)));
    }
    fclose(in);
    return pieces;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    const std::string text(reinterpret_cast<const char *>(data), size);
    const std::vector<std::string> pieces = FgetsPieces(text);
    // The scanner may look kScanPad bytes past the end; they are zero as ReadPadded leaves them.
    std::vector<char> padded(text.begin(), text.end());
    padded.resize(text.size() + norvo::login::kScanPad, '\0');
    size_t pos = 0;
    for (const std::string &piece : pieces) {
        norvo::login::PlainLine plain;
        bool isPlain = false;
        if (pos >= text.size() || norvo::login::ScanLine(padded.data() + pos, text.size() - pos, &plain,
                                                         &isPlain) != piece.size()) {
            abort();
        }
        pos += piece.size();
        // The reference: strtok's fields, joined again, give the piece back exactly.
        std::string copy = piece;
        norvo::login::SessionLine line;
        std::string again;
        if (norvo::login::ParseLine(copy.data(), &line)) {
            for (int i = 0; i < 8; ++i) {
                again += std::string(line.field[i]) + (i < 7 ? "," : "\n");
            }
        }
        if (isPlain != (again == piece)) {
            abort();
        }
        if (!isPlain) {
            continue;
        }
        for (int i = 0; i < 8; ++i) {
            if (plain.field[i] != line.field[i]) {
                abort();
            }
        }
        if (norvo::login::NumberOf(plain.field[4]) != atol(line.field[4]) ||
            norvo::login::NumberOf(plain.field[6]) != atol(line.field[6])) {
            abort();
        }
    }
    if (pos != text.size()) {
        abort();
    }
    return 0;
}
