// The records of search conditions, numbered and named for people: which records each
// condition owns, and where their and/or links lead once the conditions are joined.
#pragma once
#include <json/json.h>

#include <map>
#include <string>
#include <vector>

#include "norvo/norvosearch.h"

namespace norvo::cli {

// "FI_COND_NAME", "FI_OP_LIKE"; the number itself for a code without a name.
std::string CondTypeName(unsigned int type);
std::string CondOpName(unsigned int op);
// "name", "type", "user", "group", "mtime", "crtime", "atime", "size".
const char *ConditionKind(FileSearch::FindComp &condition);

class RecordNumbers {
public:
    // Numbers the records reachable from condition's first record, from 1 on in the order
    // found (first, then orNext, then andNext); returns the numbers of those. Call for each
    // condition before joining them, so a condition's records are its own.
    std::vector<int> Add(FileSearch::FindComp &condition);
    // 0 for null or a record never numbered.
    int Of(const __tag_FI_SQL_COND *record) const;
    const std::vector<const __tag_FI_SQL_COND *> &Records() const { return records_; }

private:
    void Visit(const __tag_FI_SQL_COND *record, std::vector<int> *numbers);
    std::map<const __tag_FI_SQL_COND *, int> numbers_;
    std::vector<const __tag_FI_SQL_COND *> records_;
};

}  // namespace norvo::cli
