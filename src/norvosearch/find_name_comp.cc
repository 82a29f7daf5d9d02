// Name conditions: the LIKE pattern of a term, its alternatives, and the test of a base name.
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <new>

#include "common/owners.h"
#include "errors/guard.h"
#include "norvo/norvomisc.h"
#include "norvo/norvosearch.h"
#include "norvosearch/sql_cond_text.h"

namespace {

// An escaped wildcard anywhere makes the whole term count as having none, even beside an
// unescaped one ("a\*b*" is wrapped too). Intended.
bool CountsAsLiteral(const char *term) {
    const bool noStar = strstr(term, "\\*") != nullptr || strchr(term, '*') == nullptr;
    const bool noMark = strstr(term, "\\?") != nullptr || strchr(term, '?') == nullptr;
    return noStar && noMark;
}

bool EndsWithBackslash(const char *term) {
    const size_t length = strlen(term);
    return length > 0 && term[length - 1] == '\\';
}

// The last non-empty component of path ("/a/dir/" gives "dir"), as a new string; null when
// memory runs out.
char *BaseNameOf(const char *path) {
    size_t end = strlen(path);
    while (end > 0 && path[end - 1] == '/') {
        --end;
    }
    size_t start = end;
    while (start > 0 && path[start - 1] != '/') {
        --start;
    }
    return strndup(path + start, end - start);
}

}  // namespace

namespace FileSearch {

FindNameComp::FindNameComp(const char *term) : alternatives(), ownCond(cond) {
    memset(pattern, 0, sizeof(pattern));
    if (term == nullptr || cond == nullptr) {
        return;
    }
    const size_t size = strlen(term) + 3;
    norvo::CString finished(static_cast<char *>(calloc(size, 1)));
    char *raw = nullptr;
    if (!finished || NvoLibStrReplace(term, "\\\\", "\\", &raw) == -1) {
        return;
    }
    norvo::CString unescaped(raw);
    const bool wrap = CountsAsLiteral(unescaped.get()) && !EndsWithBackslash(unescaped.get());
    snprintf(finished.get(), size, wrap ? "*%s*" : "%s", unescaped.get());
    norvo::search::SetSqlCondText(*cond, FI_COND_NAME, FI_OP_LIKE, finished.get(), nullptr, nullptr);
    snprintf(pattern, sizeof(pattern), "%s", finished.get());
}

FindNameComp::~FindNameComp() {
    for (FindNameComp *alternative : alternatives) {
        delete alternative;
    }
    cond = ownCond;  // the base frees this condition's own record, not an alternative's
}

bool FindNameComp::operator()(const char *path, const _tag_QUIBSTAT_ &st) {
    return norvo::Guarded<bool>(false, [&]() -> bool {
        if (path == nullptr) {
            return false;
        }
        for (FindNameComp *alternative : alternatives) {
            if ((*alternative)(path, st)) {
                return true;
            }
        }
        // A walk's paths never end in "/": their base name is tested where it lies.
        const char *slash = strrchr(path, '/');
        if (slash != nullptr && slash[1] != '\0') {
            return NvoLibStrLikeCompare(pattern, slash + 1, '\\') == 1;
        }
        norvo::CString base(BaseNameOf(path));
        return base && NvoLibStrLikeCompare(pattern, base.get(), '\\') == 1;
    });
}

void FindNameComp::orComp(FindNameComp *other) {
    norvo::GuardedVoid([&] {
        // Each condition has one owner: joining this to itself, twice, or below its own
        // alternative would free it twice.
        const auto owns = [](const auto &self, const FindNameComp *node, const FindNameComp *target) -> bool {
            for (const FindNameComp *alternative : node->alternatives) {
                if (alternative == target || self(self, alternative, target)) {
                    return true;
                }
            }
            return false;
        };
        if (other == nullptr || other == this || owns(owns, this, other) || owns(owns, other, this)) {
            return;
        }
        try {
            alternatives.push_back(other);
        } catch (const std::bad_alloc &) {
            delete other;  // ownership passed with the call: never leak it
            return;
        }
        if (other->cond != nullptr) {
            other->cond->orNext = cond;
            cond = other->cond;
        }
    });
}

}  // namespace FileSearch
