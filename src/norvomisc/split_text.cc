// Splitting delimited text into pieces, and a list of paths into their file names.
#include <string.h>

#include <string>
#include <string_view>
#include <vector>

#include "errors/guard.h"
#include "norvo/norvomisc.h"

namespace {

// Calls piece(view) for each piece of text between occurrences of delim, left to right. A
// delimiter at index 0 yields no empty first piece; empty pieces between adjacent delimiters
// are kept, and the rest after the last delimiter is always yielded (empty when text ends with
// the delimiter). delim must not be empty.
template <typename F>
void ForEachPiece(const std::string &text, const char *delim, F &&piece) {
    const std::string_view all(text);
    const std::string_view separator(delim);
    size_t start = 0;
    size_t at = all.find(separator);
    if (at == 0) {
        start = separator.size();
        at = all.find(separator, start);
    }
    while (at != std::string_view::npos) {
        piece(all.substr(start, at - start));
        start = at + separator.size();
        at = all.find(separator, start);
    }
    piece(all.substr(start));
}

bool IsEmptyDelimiter(const char *delim) {
    return delim == nullptr || delim[0] == '\0';
}

}  // namespace

void StringExplode(std::vector<std::string> &out, const std::string &text, const char *delim) {
    norvo::GuardedVoid([&] {
        if (IsEmptyDelimiter(delim)) {
            return;
        }
        ForEachPiece(text, delim, [&out](std::string_view piece) { out.emplace_back(piece); });
    });
}

void StringExplode(const std::string &text, const char *delim, void (*callback)(const std::string &, void *),
                   void *user) {
    norvo::GuardedVoid([&] {
        if (IsEmptyDelimiter(delim) || callback == nullptr) {
            return;
        }
        ForEachPiece(text, delim,
                     [callback, user](std::string_view piece) { callback(std::string(piece), user); });
    });
}

void StringExplodeToFileNameString(std::string &out, const std::string &text, const char *delim,
                                   const char *sep) {
    norvo::GuardedVoid([&] {
        if (IsEmptyDelimiter(delim)) {
            return;
        }
        out.clear();
        const std::string_view separator(sep != nullptr ? sep : "");
        bool first = true;
        ForEachPiece(text, delim, [&](std::string_view piece) {
            if (!first) {
                out += separator;
            }
            first = false;
            const size_t slash = piece.rfind('/');
            out += slash == std::string_view::npos ? piece : piece.substr(slash + 1);
        });
    });
}
