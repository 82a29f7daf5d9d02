// setSqlCond without std::string, so the conditions' constructors never allocate or throw
// while filling their records.
#pragma once
#include "norvo/norvosearch.h"

namespace norvo::search {

// As FileSearch::setSqlCond; a null value counts as "".
void SetSqlCondText(__tag_FI_SQL_COND &c, __tag_FI_SQL_COND_TYPE type, __tag_FI_SQL_COND_OP op,
                    const char *value, __tag_FI_SQL_COND *andNext, __tag_FI_SQL_COND *orNext);
void SetSqlCondNumber(__tag_FI_SQL_COND &c, __tag_FI_SQL_COND_TYPE type, __tag_FI_SQL_COND_OP op,
                      unsigned long long value, __tag_FI_SQL_COND *andNext, __tag_FI_SQL_COND *orNext);

}  // namespace norvo::search
