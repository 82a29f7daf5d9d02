// The order of listed entries: directories first, then the sort key's field, then the
// case-insensitive name. The key is decoded once per comparison object, not per comparison.
#include <stdint.h>
#include <string.h>

#include <algorithm>
#include <functional>
#include <list>
#include <string>
#include <utility>
#include <vector>

#include "norvo/norvoenum.h"
#include "norvoenum/entry_order.h"
#include "vlibc_unicode.h"

namespace {

using norvo::SortFacts;
using norvo::SortRule;

// Decides a and b by the folders-first rule and the rule's field: true with *before set when
// they differ there; false when they tie, and the name decides.
bool DecidedBeforeName(SortRule rule, const SortFacts &a, const SortFacts &b, bool *before) {
    if (a.isdir != b.isdir) {
        *before = a.isdir;
        return true;
    }
    switch (rule) {
        case SortRule::kName:
            return false;
        case SortRule::kSize:
            // Sizes are unsigned: compared as such (folders carry 0 and so stay in name order).
            if (static_cast<uint64_t>(a.value) != static_cast<uint64_t>(b.value)) {
                *before = static_cast<uint64_t>(a.value) < static_cast<uint64_t>(b.value);
                return true;
            }
            return false;
        case SortRule::kType: {
            const int order = VLIBCUnicodeUTF8StrCaseCmp(a.type, b.type);
            *before = order < 0;
            return order != 0;
        }
        default:
            if (a.value != b.value) {
                *before = a.value < b.value;
                return true;
            }
            return false;
    }
}

}  // namespace

namespace norvo {

SortRule SortRuleOf(const std::string &key) {
    static const std::pair<const char *, SortRule> kKeys[] = {
        {"size", SortRule::kSize},   {"mtime", SortRule::kMtime}, {"crtime", SortRule::kCrtime},
        {"ctime", SortRule::kCtime}, {"atime", SortRule::kAtime}, {"user", SortRule::kUser},
        {"group", SortRule::kGroup}, {"posix", SortRule::kPosix}, {"type", SortRule::kType},
    };
    for (const auto &entry : kKeys) {
        if (key == entry.first) {
            return entry.second;
        }
    }
    return SortRule::kName;
}

}  // namespace norvo

EnumCompare::EnumCompare(std::string key)
    : key_(std::move(key)), rule_(static_cast<int>(norvo::SortRuleOf(key_))) {}

bool EnumCompare::operator()(const DIRENTRY_INFO &a, const DIRENTRY_INFO &b) const {
    const auto rule = static_cast<SortRule>(rule_);
    bool before = false;
    if (DecidedBeforeName(rule, norvo::SortFactsOf(rule, a), norvo::SortFactsOf(rule, b), &before)) {
        return before;
    }
    return VLIBCUnicodeUTF8StrCaseCmp(a.name.c_str(), b.name.c_str()) < 0;
}

namespace {

// One record as the sort sees it: the deciding facts copied out, so comparisons touch a small
// array instead of the records. The order is exactly EnumCompare's: directories first, then
// the rule's field, then the case-insensitive name. Each name's ASCII prefix is also kept
// lower-cased (in one shared buffer): VLIBCUnicodeUTF8StrCaseCmp compares exactly those bytes
// while both names are ASCII, so a difference there, or two whole ASCII names, decide as the
// function would. Any other pair asks the function itself.
struct SortRef {
    size_t position;
    SortFacts facts;
    size_t foldedAt;      // offset of the name's lower-cased ASCII prefix in the buffer
    uint32_t foldedSize;  // its length
    bool ascii;           // the prefix is the whole name
};

class RefLess {
public:
    RefLess(SortRule rule, const std::string &folded) : rule_(rule), folded_(folded.data()) {}

    bool operator()(const SortRef &a, const SortRef &b) const {
        bool before = false;
        if (DecidedBeforeName(rule_, a.facts, b.facts, &before)) {
            return before;
        }
        // The lower-cased ASCII prefixes decide where they differ, or where both are the whole
        // names; otherwise the function compares the names from the start.
        const size_t common = a.foldedSize < b.foldedSize ? a.foldedSize : b.foldedSize;
        const int order = memcmp(folded_ + a.foldedAt, folded_ + b.foldedAt, common);
        if (order != 0) {
            return order < 0;
        }
        if (a.ascii && b.ascii) {
            return a.foldedSize < b.foldedSize;
        }
        return VLIBCUnicodeUTF8StrCaseCmp(a.facts.name, b.facts.name) < 0;
    }

private:
    SortRule rule_;
    const char *folded_;
};

// Appends the lower-cased ASCII prefix of the C string text to folded: its bytes before the
// first one of 0x80 or above. Returns its length; *whole tells whether it is all of text.
size_t FoldAsciiPrefix(const char *text, std::string *folded, bool *whole) {
    size_t length = 0;
    while (text[length] != '\0' && static_cast<unsigned char>(text[length]) < 0x80) {
        const auto byte = static_cast<unsigned char>(text[length]);
        folded->push_back(static_cast<char>(byte >= 'A' && byte <= 'Z' ? byte + ('a' - 'A') : byte));
        ++length;
    }
    *whole = text[length] == '\0';
    return length;
}

// Sorts the list through SortedPositions, then relinks the nodes in that order (no record
// moves). Throws only before the list is touched.
void SortByPositions(std::list<DIRENTRY_INFO> &list, SortRule rule) {
    std::vector<std::list<DIRENTRY_INFO>::iterator> nodes;
    nodes.reserve(list.size());
    for (auto it = list.begin(); it != list.end(); ++it) {
        nodes.push_back(it);
    }
    const std::vector<size_t> order = norvo::SortedPositions(
        nodes.size(), rule, [&](size_t i) { return norvo::SortFactsOf(rule, *nodes[i]); });
    std::list<DIRENTRY_INFO> sorted;
    for (const size_t position : order) {
        sorted.splice(sorted.end(), list, nodes[position]);
    }
    list.swap(sorted);
}

}  // namespace

namespace norvo {

SortFacts SortFactsOf(SortRule rule, const DIRENTRY_INFO &entry) {
    SortFacts facts{entry.name.c_str(), entry.type.c_str(), 0, entry.isdir};
    switch (rule) {
        case SortRule::kSize:
            facts.value = entry.isdir ? 0 : static_cast<int64_t>(entry.size);
            break;
        case SortRule::kMtime:
            facts.value = entry.mtime;
            break;
        case SortRule::kCrtime:
            facts.value = entry.crtime;
            break;
        case SortRule::kCtime:
            facts.value = entry.ctime;
            break;
        case SortRule::kAtime:
            facts.value = entry.atime;
            break;
        // By number on purpose: the owner's id, not the owner's name, orders "user" and "group".
        case SortRule::kUser:
            facts.value = entry.uid;
            break;
        case SortRule::kGroup:
            facts.value = entry.gid;
            break;
        case SortRule::kPosix:
            facts.value = entry.mode & 0x1FFu;
            break;
        default:
            break;
    }
    return facts;
}

std::vector<size_t> SortedPositions(size_t count, SortRule rule,
                                    const std::function<SortFacts(size_t)> &factsAt) {
    std::vector<SortRef> refs;
    refs.reserve(count);
    std::string folded;
    for (size_t i = 0; i < count; ++i) {
        const SortFacts facts = factsAt(i);
        SortRef ref{i, facts, folded.size(), 0, false};
        const size_t before = folded.size();
        const size_t length = FoldAsciiPrefix(facts.name, &folded, &ref.ascii);
        if (length > UINT32_MAX) {  // never for a file name; compared by the function then
            folded.resize(before);
            ref.ascii = false;
        } else {
            ref.foldedSize = static_cast<uint32_t>(length);
        }
        refs.push_back(ref);
    }
    // The same strict weak order as EnumCompare, and stable like the list's own sort: the same
    // result, ties in their first order.
    std::stable_sort(refs.begin(), refs.end(), RefLess(rule, folded));
    std::vector<size_t> order;
    order.reserve(count);
    for (const SortRef &ref : refs) {
        order.push_back(ref.position);
    }
    return order;
}

}  // namespace norvo

void NvoEnum::EntryListSort(std::list<DIRENTRY_INFO> &list, std::string key) {
    if (list.empty()) {
        return;
    }
    try {
        SortByPositions(list, norvo::SortRuleOf(key));
        return;
    } catch (...) {
        // Out of memory for the references: the list is untouched; sort it in place instead.
    }
    const EnumCompare compare(std::move(key));
    // The list's own merge sort is stable; by reference, so the merges never copy the key.
    // Only the comparator can throw (it doesn't), so nothing escapes here.
    list.sort(std::cref(compare));
}
