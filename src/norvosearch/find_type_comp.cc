// Type conditions: directories, or regular files only.
#include <strings.h>
#include <new>

#include "errors/guard.h"
#include "norvo/norvosearch.h"
#include "norvosearch/sql_cond_text.h"

namespace {
constexpr unsigned kTypeMask = 0xF000;
constexpr unsigned kDirectory = 0x4000;
constexpr unsigned kRegularFile = 0x8000;
}  // namespace

namespace FileSearch {

FindTypeComp::FindTypeComp(bool dir) : isDir(dir) {
    if (cond != nullptr) {
        norvo::search::SetSqlCondText(*cond, FI_COND_IS_DIR, FI_OP_EQ, dir ? "1" : "0", nullptr, nullptr);
    }
}

FindTypeComp::~FindTypeComp() = default;

bool FindTypeComp::operator()(const char * /*path*/, const _tag_QUIBSTAT_ &st) {
    return (st.st_mode & kTypeMask) == (isDir ? kDirectory : kRegularFile);
}

FindComp *FindTypeCompFactory::createFindTypeOpt(const char *word) {
    return norvo::Guarded<FindComp *>(nullptr, [&]() -> FindComp * {
        if (word == nullptr) {
            return nullptr;
        }
        if (strcasecmp(word, "dir") == 0) {
            return new (std::nothrow) FindTypeComp(true);
        }
        if (strcasecmp(word, "file") == 0) {
            return new (std::nothrow) FindTypeComp(false);
        }
        return nullptr;
    });
}

}  // namespace FileSearch
