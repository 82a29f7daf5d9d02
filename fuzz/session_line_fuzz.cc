// The session file's lines as authorisation reads them: the pieces are those fgets gives, and a
// line taken by the fast path (carried over byte for byte) has exactly the fields the plain
// strtok reading gives and rewrites to the same bytes; numbers read as atol reads them.
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
    std::vector<std::string> pieces;
    norvo::login::ForEachPiece(text, kLineBuffer,
                               [&](std::string_view piece) { pieces.emplace_back(piece); });
    if (pieces != FgetsPieces(text)) {
        abort();
    }
    for (const std::string &piece : pieces) {
        norvo::login::PlainLine plain;
        if (!norvo::login::SplitPlain(piece, &plain)) {
            continue;
        }
        std::string copy = piece;
        norvo::login::SessionLine line;
        if (!norvo::login::ParseLine(copy.data(), &line)) {
            abort();
        }
        std::string again;
        for (int i = 0; i < 8; ++i) {
            if (plain.field[i] != line.field[i]) {
                abort();
            }
            again += std::string(line.field[i]) + (i < 7 ? "," : "\n");
        }
        if (again != piece || norvo::login::NumberOf(plain.field[4]) != atol(line.field[4]) ||
            norvo::login::NumberOf(plain.field[6]) != atol(line.field[6])) {
            abort();
        }
    }
    return 0;
}
