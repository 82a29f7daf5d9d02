// The entries a directory listing keeps, held compactly as their facts until the page is cut,
// so that only the page's records are ever built: a listing of 100,000 entries that returns 100
// allocates 100 records, and asks the name caches about 100 owners, not 100,000.
#pragma once
#include <stddef.h>
#include <stdint.h>

#include <string>
#include <vector>

#include "norvo/norvoenum.h"
#include "norvoenum/entry_facts.h"
#include "norvoenum/entry_order.h"

namespace norvo {

class KeptEntries {
public:
    // rule: the sort rule whose value each entry's facts carry; info: the groups of fields the
    // records are built with.
    KeptEntries(SortRule rule, int info) : rule_(rule), info_(info) {}

    // Keeps the entry name with its facts. Throws std::bad_alloc (and then keeps nothing).
    void Add(const char *name, const EntryFacts &facts);

    size_t Size() const { return kept_.size(); }

    // The sort facts of entry i; its strings stay valid until the next Add.
    SortFacts FactsAt(size_t i) const;

    // Builds entry i's record in a fresh one, as FillFileInfo would have filled it for the user
    // path userDir + "/" + name and the real path realDir + "/" + name; owner names come from
    // names.
    void Build(size_t i, const std::string &userDir, const std::string &realDir, NorvoUserEnum &names,
               DIRENTRY_INFO &entry) const;

private:
    struct Kept {
        size_t nameAt;  // in text_, NUL-terminated there
        size_t nameSize;
        size_t typeAt;  // likewise
        size_t typeSize;
        int64_t sortValue;
        EntryFacts facts;
    };

    size_t Append(const std::string &text);

    SortRule rule_;
    int info_;
    std::vector<Kept> kept_;
    std::string text_;  // names and types, each followed by a NUL
    std::string scratch_;
};

}  // namespace norvo
