// The base of every condition: record ownership and the conjunction link.
#include <stdlib.h>

#include "errors/guard.h"
#include "norvo/norvosearch.h"

namespace FileSearch {

// calloc rather than new: a constructor must not throw across the library's boundary. A
// failed allocation leaves cond null, which every user of it tolerates.
FindComp::FindComp()
    : cond(static_cast<__tag_FI_SQL_COND *>(calloc(1, sizeof(__tag_FI_SQL_COND)))), extraCond(nullptr) {}

FindComp::~FindComp() {
    free(cond);
    free(extraCond);
}

__tag_FI_SQL_COND *FindComp::getFirstCond() {
    return cond;
}

// A user or group condition links onward from its name record, the end of its OR pair; a size
// "equal" condition from its lower bound, the end of its AND pair.
void FindComp::operator()(FindComp *next) {
    norvo::GuardedVoid([&] {
        if (next == nullptr) {
            return;
        }
        __tag_FI_SQL_COND *last = extraCond != nullptr ? extraCond : cond;
        if (last != nullptr) {
            last->andNext = next->cond;
        }
    });
}

}  // namespace FileSearch
