// Substring replacement into a newly allocated C string.
#include <errno.h>
#include <stdlib.h>
#include <string.h>

#include "common/log.h"
#include "common/modules.h"
#include "common/text.h"
#include "errors/guard.h"
#include "norvo/norvomisc.h"

using norvo::kNorvoMisc;

namespace {

struct Pair {
    const char *from;
    size_t fromLength;
    const char *to;
    size_t toLength;
    const char *next;  // the next occurrence of from at or after the scan, or null
};

// Walks src left to right; at each position the pairs are tried in order and a match is
// replaced, the walk going on after it (inserted text is never searched). emit(text, length)
// receives the output piece by piece. Returns the number of replacements.
template <typename Emit>
size_t Walk(const char *src, Pair *pairs, size_t count, Emit emit) {
    for (size_t i = 0; i < count; ++i) {
        pairs[i].next = strstr(src, pairs[i].from);
    }
    size_t replaced = 0;
    const char *at = src;
    for (;;) {
        const Pair *first = nullptr;
        for (size_t i = 0; i < count; ++i) {
            if (pairs[i].next != nullptr && pairs[i].next < at) {
                pairs[i].next = strstr(at, pairs[i].from);
            }
            if (pairs[i].next != nullptr && (first == nullptr || pairs[i].next < first->next)) {
                first = &pairs[i];
            }
        }
        if (first == nullptr) {
            break;
        }
        emit(at, static_cast<size_t>(first->next - at));
        emit(first->to, first->toLength);
        at = first->next + first->fromLength;
        ++replaced;
    }
    emit(at, strlen(at));
    return replaced;
}

int Replace(const char *src, Pair *pairs, size_t count, char **out) {
    size_t length = 0;
    const size_t replaced = Walk(src, pairs, count, [&length](const char *, size_t n) { length += n; });
    if (replaced == 0) {
        *out = strdup(src);
        if (*out == nullptr) {
            const int err = errno;
            NVO_LOG(kNorvoMisc, "%s(%d) failed to strdup input %s, reason=%s", src, strerror(err));
            return -1;
        }
        return 0;
    }
    char *buffer = static_cast<char *>(calloc(length + 1, 1));
    if (buffer == nullptr) {
        const int err = errno;
        NVO_LOG(kNorvoMisc, "%s(%d): failed to calloc, errno=%s", strerror(err));
        return -1;
    }
    char *end = buffer;
    Walk(src, pairs, count, [&end](const char *text, size_t n) {
        memcpy(end, text, n);
        end += n;
    });
    *out = buffer;
    return 1;
}

Pair MakePair(const char *from, const char *to) {
    return Pair{from, strlen(from), to, strlen(to), nullptr};
}

}  // namespace

int NvoLibStrReplace(const char *src, const char *from, const char *to, char **out) {
    return norvo::Guarded<int>(-1, [&]() -> int {
        if (out == nullptr) {
            return -1;
        }
        *out = nullptr;
        if (norvo::IsEmpty(src) || norvo::IsEmpty(from) || norvo::IsEmpty(to)) {
            return -1;
        }
        Pair pairs[] = {MakePair(from, to)};
        return Replace(src, pairs, 1, out);
    });
}

int NvoLibTwoStrReplace(const char *src, const char *from1, const char *to1, const char *from2,
                        const char *to2, char **out) {
    return norvo::Guarded<int>(-1, [&]() -> int {
        if (out == nullptr) {
            return -1;
        }
        *out = nullptr;
        if (norvo::IsEmpty(src) || norvo::IsEmpty(from1) || norvo::IsEmpty(to1) || norvo::IsEmpty(from2) ||
            norvo::IsEmpty(to2)) {
            return -1;
        }
        Pair pairs[] = {MakePair(from1, to1), MakePair(from2, to2)};
        return Replace(src, pairs, 2, out);
    });
}
