// The file index's condition record: its layout is checked here for the target compiled for,
// since the platform's file index reads it as raw memory.
#include <stddef.h>
#include <stdint.h>
#include <stdio.h>
#include <string.h>

#include <string>

#include "errors/guard.h"
#include "norvo/norvosearch.h"
#include "norvosearch/sql_cond_text.h"

static_assert(sizeof(__tag_FI_SQL_COND_TYPE) == 4 && sizeof(__tag_FI_SQL_COND_OP) == 4,
              "the codes are 32-bit on the wire");
#if UINTPTR_MAX == 0xFFFFFFFFu
static_assert(offsetof(__tag_FI_SQL_COND, andNext) == 0 && offsetof(__tag_FI_SQL_COND, orNext) == 4 &&
                  offsetof(__tag_FI_SQL_COND, type) == 8 && offsetof(__tag_FI_SQL_COND, op) == 12 &&
                  offsetof(__tag_FI_SQL_COND, value) == 16,
              "condition record layout (4-byte pointers)");
static_assert(sizeof(__tag_FI_SQL_COND) == 4112, "condition record size (4-byte pointers)");
#elif UINTPTR_MAX == 0xFFFFFFFFFFFFFFFFu
static_assert(offsetof(__tag_FI_SQL_COND, andNext) == 0 && offsetof(__tag_FI_SQL_COND, orNext) == 8 &&
                  offsetof(__tag_FI_SQL_COND, type) == 16 && offsetof(__tag_FI_SQL_COND, op) == 20 &&
                  offsetof(__tag_FI_SQL_COND, value) == 24,
              "condition record layout (8-byte pointers)");
static_assert(sizeof(__tag_FI_SQL_COND) == 4120, "condition record size (8-byte pointers)");
#else
#error "the condition record's layout is known for 4- and 8-byte pointers only"
#endif

namespace norvo::search {

void SetSqlCondText(__tag_FI_SQL_COND &c, __tag_FI_SQL_COND_TYPE type, __tag_FI_SQL_COND_OP op,
                    const char *value, __tag_FI_SQL_COND *andNext, __tag_FI_SQL_COND *orNext) {
    memset(&c, 0, sizeof(c));
    c.andNext = andNext;
    c.orNext = orNext;
    c.type = type;
    c.op = op;
    snprintf(c.value, sizeof(c.value), "%s", value != nullptr ? value : "");
}

void SetSqlCondNumber(__tag_FI_SQL_COND &c, __tag_FI_SQL_COND_TYPE type, __tag_FI_SQL_COND_OP op,
                      unsigned long long value, __tag_FI_SQL_COND *andNext, __tag_FI_SQL_COND *orNext) {
    char text[128];
    snprintf(text, sizeof(text), "%llu", value);
    SetSqlCondText(c, type, op, text, andNext, orNext);
}

}  // namespace norvo::search

namespace FileSearch {

void setSqlCond(__tag_FI_SQL_COND &c, __tag_FI_SQL_COND_TYPE type, __tag_FI_SQL_COND_OP op, std::string value,
                __tag_FI_SQL_COND *andNext, __tag_FI_SQL_COND *orNext) {
    norvo::GuardedVoid([&] { norvo::search::SetSqlCondText(c, type, op, value.c_str(), andNext, orNext); });
}

void setSqlCond(__tag_FI_SQL_COND &c, __tag_FI_SQL_COND_TYPE type, __tag_FI_SQL_COND_OP op,
                unsigned long long value, __tag_FI_SQL_COND *andNext, __tag_FI_SQL_COND *orNext) {
    norvo::search::SetSqlCondNumber(c, type, op, value, andNext, orNext);
}

}  // namespace FileSearch
