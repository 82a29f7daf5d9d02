#include "condition_records.h"

namespace norvo::cli {

namespace {

template <typename T>
bool Is(FileSearch::FindComp &condition) {
    return dynamic_cast<T *>(&condition) != nullptr;
}

std::string NameOf(const std::map<unsigned int, const char *> &names, unsigned int code) {
    const auto found = names.find(code);
    return found != names.end() ? found->second : std::to_string(code);
}

}  // namespace

std::string CondTypeName(unsigned int type) {
    static const std::map<unsigned int, const char *> kNames = {
        {FI_COND_NAME, "FI_COND_NAME"},
        {FI_COND_REAL_PATH, "FI_COND_REAL_PATH"},
        {FI_COND_PARENT_PATH, "FI_COND_PARENT_PATH"},
        {FI_COND_SHARE, "FI_COND_SHARE"},
        {FI_COND_PATH, "FI_COND_PATH"},
        {FI_COND_IS_DIR, "FI_COND_IS_DIR"},
        {FI_COND_SIZE, "FI_COND_SIZE"},
        {FI_COND_TYPE, "FI_COND_TYPE"},
        {FI_COND_CRTIME, "FI_COND_CRTIME"},
        {FI_COND_CTIME, "FI_COND_CTIME"},
        {FI_COND_ATIME, "FI_COND_ATIME"},
        {FI_COND_MTIME, "FI_COND_MTIME"},
        {FI_COND_POSIX, "FI_COND_POSIX"},
        {FI_COND_MODE, "FI_COND_MODE"},
        {FI_COND_UID, "FI_COND_UID"},
        {FI_COND_GID, "FI_COND_GID"},
        {FI_COND_USER_NAME, "FI_COND_USER_NAME"},
        {FI_COND_GROUP_NAME, "FI_COND_GROUP_NAME"},
    };
    return NameOf(kNames, type);
}

std::string CondOpName(unsigned int op) {
    static const std::map<unsigned int, const char *> kNames = {
        {FI_OP_EQ, "FI_OP_EQ"},
        {FI_OP_LT, "FI_OP_LT"},
        {FI_OP_GT, "FI_OP_GT"},
        {FI_OP_GE, "FI_OP_GE"},
        {FI_OP_LIKE, "FI_OP_LIKE"},
        {FI_OP_PATH_LIKE, "FI_OP_PATH_LIKE"},
        {FI_OP_PATH_NOT_LIKE, "FI_OP_PATH_NOT_LIKE"},
    };
    return NameOf(kNames, op);
}

const char *ConditionKind(FileSearch::FindComp &condition) {
    using namespace FileSearch;
    if (Is<FindNameComp>(condition)) {
        return "name";
    }
    if (Is<FindTypeComp>(condition)) {
        return "type";
    }
    if (Is<FindUserComp>(condition)) {
        return "user";
    }
    if (Is<FindGroupComp>(condition)) {
        return "group";
    }
    if (Is<FindMTimeComp>(condition)) {
        return "mtime";
    }
    if (Is<FindCRTimeComp>(condition)) {
        return "crtime";
    }
    if (Is<FindATimeComp>(condition)) {
        return "atime";
    }
    if (Is<FindSizeComp>(condition)) {
        return "size";
    }
    return "other";
}

std::vector<int> RecordNumbers::Add(FileSearch::FindComp &condition) {
    std::vector<int> numbers;
    Visit(condition.getFirstCond(), &numbers);
    return numbers;
}

void RecordNumbers::Visit(const __tag_FI_SQL_COND *record, std::vector<int> *numbers) {
    // Each record once, so a chain that meets itself cannot loop.
    if (record == nullptr || numbers_.count(record) != 0) {
        return;
    }
    records_.push_back(record);
    numbers_[record] = static_cast<int>(records_.size());
    numbers->push_back(static_cast<int>(records_.size()));
    Visit(record->orNext, numbers);
    Visit(record->andNext, numbers);
}

int RecordNumbers::Of(const __tag_FI_SQL_COND *record) const {
    const auto found = numbers_.find(record);
    return found != numbers_.end() ? found->second : 0;
}

}  // namespace norvo::cli
