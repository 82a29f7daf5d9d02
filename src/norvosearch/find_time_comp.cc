// Time conditions: at or after a moment, or before it, on one of the file's times.
#include <strings.h>

#include "norvo/norvosearch.h"
#include "norvosearch/sql_cond_text.h"

namespace {
constexpr int kAtOrAfter = 2;
constexpr int kBefore = 3;
}  // namespace

namespace FileSearch {

// Unlike the size's operator words, "before" is taken in any case. Intended.
FindTimeComp::FindTimeComp(__tag_FI_SQL_COND_TYPE type, const char *op, long when)
    : mode(op != nullptr && strcasecmp(op, "before") == 0 ? kBefore : kAtOrAfter),
      lowTime(when),
      highTime(when) {
    if (cond != nullptr) {
        // Sign-extended first, so a moment before 1970 reads as its 64-bit two's complement.
        const auto operand = static_cast<unsigned long long>(static_cast<long long>(when));
        norvo::search::SetSqlCondNumber(*cond, type, mode == kBefore ? FI_OP_LT : FI_OP_GE, operand, nullptr,
                                        nullptr);
    }
}

FindTimeComp::~FindTimeComp() = default;

bool FindTimeComp::operator()(const char * /*path*/, const _tag_QUIBSTAT_ &st) {
    const long time = getTime(st);
    switch (mode) {
        case kAtOrAfter:
            return lowTime <= time;
        case kBefore:
            return time < highTime;
        default:
            return false;
    }
}

FindMTimeComp::FindMTimeComp(const char *op, long when) : FindTimeComp(FI_COND_MTIME, op, when) {}
FindMTimeComp::~FindMTimeComp() = default;
long FindMTimeComp::getTime(const _tag_QUIBSTAT_ &st) {
    return st.st_mtim.tv_sec;
}

FindCRTimeComp::FindCRTimeComp(const char *op, long when) : FindTimeComp(FI_COND_CRTIME, op, when) {}
FindCRTimeComp::~FindCRTimeComp() = default;
long FindCRTimeComp::getTime(const _tag_QUIBSTAT_ &st) {
    return st.st_crtim.tv_sec;
}

FindATimeComp::FindATimeComp(const char *op, long when) : FindTimeComp(FI_COND_ATIME, op, when) {}
FindATimeComp::~FindATimeComp() = default;
long FindATimeComp::getTime(const _tag_QUIBSTAT_ &st) {
    return st.st_atim.tv_sec;
}

}  // namespace FileSearch
