// Owner and group conditions: the id decides in memory; the index may match the name instead.
#include <stdlib.h>

#include "norvo/norvosearch.h"
#include "norvosearch/sql_cond_text.h"

namespace {

// The id a failed lookup leaves behind; it must never pass for a real owner.
constexpr unsigned int kNoId = 0xFFFFFFFFu;

// extraCond = (nameType, LIKE, name); cond = (idType, EQ, id) with orNext = extraCond.
void BuildOwnerRecords(__tag_FI_SQL_COND *cond, __tag_FI_SQL_COND **extraCond, __tag_FI_SQL_COND_TYPE idType,
                       __tag_FI_SQL_COND_TYPE nameType, const char *name, unsigned int id) {
    *extraCond = static_cast<__tag_FI_SQL_COND *>(calloc(1, sizeof(__tag_FI_SQL_COND)));
    if (*extraCond != nullptr) {
        norvo::search::SetSqlCondText(**extraCond, nameType, FI_OP_LIKE, name, nullptr, nullptr);
    }
    if (cond != nullptr) {
        norvo::search::SetSqlCondNumber(*cond, idType, FI_OP_EQ, id, nullptr, *extraCond);
    }
}

}  // namespace

namespace FileSearch {

FindUserComp::FindUserComp(const char *name, unsigned int id) : uid(id) {
    BuildOwnerRecords(cond, &extraCond, FI_COND_UID, FI_COND_USER_NAME, name, id);
}

FindUserComp::~FindUserComp() = default;

bool FindUserComp::operator()(const char * /*path*/, const _tag_QUIBSTAT_ &st) {
    return uid != kNoId && st.st_uid == uid;
}

FindGroupComp::FindGroupComp(const char *name, unsigned int id) : gid(id) {
    BuildOwnerRecords(cond, &extraCond, FI_COND_GID, FI_COND_GROUP_NAME, name, id);
}

FindGroupComp::~FindGroupComp() = default;

bool FindGroupComp::operator()(const char * /*path*/, const _tag_QUIBSTAT_ &st) {
    return gid != kNoId && st.st_gid == gid;
}

}  // namespace FileSearch
