// Size conditions, with the tolerance that makes "equal" mean "about this size".
#include <limits.h>
#include <stdlib.h>
#include <string.h>

#include "norvo/norvosearch.h"
#include "norvosearch/sql_cond_text.h"

namespace {

constexpr int kEqual = 1;
constexpr int kGreater = 2;
constexpr int kLess = 3;
constexpr unsigned kTypeMask = 0xF000;
constexpr unsigned kDirectory = 0x4000;

// Case matters here, unlike "before" for times: "EQUAL" means greater than. Intended.
int ModeOf(const char *op) {
    if (op != nullptr && strcmp(op, "equal") == 0) {
        return kEqual;
    }
    if (op != nullptr && strcmp(op, "less") == 0) {
        return kLess;
    }
    return kGreater;
}

// One twentieth of the size (a quarter, then a fifth, rounding toward zero), at least 1.
long long ToleranceOf(long long bytes) {
    const long long d = (bytes >> 2) / 5;
    return d < 1 ? 1 : d;
}

unsigned long long Operand(long long bytes) {
    return static_cast<unsigned long long>(bytes);
}

}  // namespace

namespace FileSearch {

FindSizeComp::FindSizeComp(const char *op, long long bytes) : mode(ModeOf(op)), upper(0), size(bytes) {
    if (mode == kEqual) {
        const long long d = ToleranceOf(bytes);
        upper = bytes > LLONG_MAX - d ? LLONG_MAX : bytes + d;
        size = bytes > d ? bytes - d : 0;
        extraCond = static_cast<__tag_FI_SQL_COND *>(calloc(1, sizeof(__tag_FI_SQL_COND)));
        if (extraCond != nullptr) {
            norvo::search::SetSqlCondNumber(*extraCond, FI_COND_SIZE, FI_OP_GE, Operand(size), nullptr,
                                            nullptr);
        }
        if (cond != nullptr) {
            norvo::search::SetSqlCondNumber(*cond, FI_COND_SIZE, FI_OP_LT, Operand(upper), extraCond,
                                            nullptr);
        }
        return;
    }
    if (cond != nullptr) {
        norvo::search::SetSqlCondNumber(*cond, FI_COND_SIZE, mode == kLess ? FI_OP_LT : FI_OP_GT,
                                        Operand(bytes), nullptr, nullptr);
    }
}

FindSizeComp::~FindSizeComp() = default;

bool FindSizeComp::operator()(const char * /*path*/, const _tag_QUIBSTAT_ &st) {
    const long long fileSize = (st.st_mode & kTypeMask) == kDirectory ? 0 : st.st_size;
    switch (mode) {
        case kEqual:
            return size <= fileSize && fileSize < upper;
        case kGreater:
            return fileSize > size;
        case kLess:
            return fileSize < size;
        default:
            return false;
    }
}

}  // namespace FileSearch
