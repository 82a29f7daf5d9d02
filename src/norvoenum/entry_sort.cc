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
#include "vlibc_unicode.h"

namespace {

enum Rule { kByName, kBySize, kByMtime, kByCrtime, kByCtime, kByAtime, kByUser, kByGroup, kByPosix, kByType };

Rule RuleOf(const std::string &key) {
    static const std::pair<const char *, Rule> kKeys[] = {
        {"size", kBySize}, {"mtime", kByMtime}, {"crtime", kByCrtime}, {"ctime", kByCtime}, {"atime", kByAtime},
        {"user", kByUser}, {"group", kByGroup}, {"posix", kByPosix},   {"type", kByType},
    };
    for (const auto &entry : kKeys) {
        if (key == entry.first) {
            return entry.second;
        }
    }
    return kByName;
}

// Decides a and b when the values differ; otherwise leaves the decision to the name.
template <typename T>
bool Differ(T a, T b, bool *before) {
    if (a == b) {
        return false;
    }
    *before = a < b;
    return true;
}

}  // namespace

EnumCompare::EnumCompare(std::string key) : key_(std::move(key)), rule_(RuleOf(key_)) {}

bool EnumCompare::operator()(const DIRENTRY_INFO &a, const DIRENTRY_INFO &b) const {
    if (a.isdir != b.isdir) {
        return a.isdir;
    }
    bool before = false;
    switch (rule_) {
    case kBySize:
        // Folders carry no meaningful size: they stay in name order.
        if (!a.isdir && Differ(a.size, b.size, &before)) {
            return before;
        }
        break;
    case kByMtime:
        if (Differ(a.mtime, b.mtime, &before)) {
            return before;
        }
        break;
    case kByCrtime:
        if (Differ(a.crtime, b.crtime, &before)) {
            return before;
        }
        break;
    case kByCtime:
        if (Differ(a.ctime, b.ctime, &before)) {
            return before;
        }
        break;
    case kByAtime:
        if (Differ(a.atime, b.atime, &before)) {
            return before;
        }
        break;
    // By number on purpose: the owner's id, not the owner's name, orders "user" and "group".
    case kByUser:
        if (Differ(a.uid, b.uid, &before)) {
            return before;
        }
        break;
    case kByGroup:
        if (Differ(a.gid, b.gid, &before)) {
            return before;
        }
        break;
    case kByPosix:
        if (Differ(a.mode & 0x1FFu, b.mode & 0x1FFu, &before)) {
            return before;
        }
        break;
    case kByType: {
        const int order = VLIBCUnicodeUTF8StrCaseCmp(a.type.c_str(), b.type.c_str());
        if (order != 0) {
            return order < 0;
        }
        break;
    }
    default:
        break;
    }
    return VLIBCUnicodeUTF8StrCaseCmp(a.name.c_str(), b.name.c_str()) < 0;
}

namespace {

// One record as the sort sees it: the deciding facts copied out, so comparisons touch a small
// array instead of the list's nodes. The order is exactly EnumCompare's: directories first, then
// the rule's field, then the case-insensitive name. Each name's ASCII prefix is also kept
// lower-cased (in one shared buffer): VLIBCUnicodeUTF8StrCaseCmp compares exactly those bytes
// while both names are ASCII, so a difference there, or two whole ASCII names, decide as the
// function would. Any other pair asks the function itself.
struct SortRef {
    std::list<DIRENTRY_INFO>::iterator it;
    int64_t value;        // the rule's field (0 where the rule doesn't look)
    size_t foldedAt;      // offset of the name's lower-cased ASCII prefix in the buffer
    uint32_t foldedSize;  // its length
    bool ascii;           // the prefix is the whole name
    bool isdir;
};

int64_t ValueOf(Rule rule, const DIRENTRY_INFO &entry) {
    switch (rule) {
    case kBySize:
        return entry.isdir ? 0 : static_cast<int64_t>(entry.size);
    case kByMtime:
        return entry.mtime;
    case kByCrtime:
        return entry.crtime;
    case kByCtime:
        return entry.ctime;
    case kByAtime:
        return entry.atime;
    case kByUser:
        return entry.uid;
    case kByGroup:
        return entry.gid;
    case kByPosix:
        return entry.mode & 0x1FFu;
    default:
        return 0;
    }
}

class RefLess {
public:
    RefLess(Rule rule, const std::string &folded) : rule_(rule), folded_(folded.data()) {}

    bool operator()(const SortRef &a, const SortRef &b) const {
        if (a.isdir != b.isdir) {
            return a.isdir;
        }
        if (rule_ == kBySize) {
            // Sizes are unsigned: compare as such (folders carry 0 and so stay in name order).
            const auto sa = static_cast<uint64_t>(a.value);
            const auto sb = static_cast<uint64_t>(b.value);
            if (sa != sb) {
                return sa < sb;
            }
        } else if (rule_ == kByType) {
            const int order = VLIBCUnicodeUTF8StrCaseCmp(a.it->type.c_str(), b.it->type.c_str());
            if (order != 0) {
                return order < 0;
            }
        } else if (a.value != b.value) {
            return a.value < b.value;
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
        return VLIBCUnicodeUTF8StrCaseCmp(a.it->name.c_str(), b.it->name.c_str()) < 0;
    }

private:
    Rule rule_;
    const char *folded_;
};

// Appends the lower-cased ASCII prefix of the name (as a C string: up to its first NUL) to folded:
// its bytes before the first one of 0x80 or above. Returns its length; *whole tells whether it is
// the whole C string.
size_t FoldAsciiPrefix(const std::string &name, std::string *folded, bool *whole) {
    const char *text = name.c_str();
    size_t length = 0;
    while (text[length] != '\0' && static_cast<unsigned char>(text[length]) < 0x80) {
        const auto byte = static_cast<unsigned char>(text[length]);
        folded->push_back(static_cast<char>(byte >= 'A' && byte <= 'Z' ? byte + ('a' - 'A') : byte));
        ++length;
    }
    *whole = text[length] == '\0';
    return length;
}

// Sorts through the array of references, then relinks the nodes in that order (no record moves).
// Throws only while building the array, before the list is touched.
void SortByRefs(std::list<DIRENTRY_INFO> &list, Rule rule) {
    std::vector<SortRef> refs;
    refs.reserve(list.size());
    std::string folded;
    for (auto it = list.begin(); it != list.end(); ++it) {
        SortRef ref{it, ValueOf(rule, *it), folded.size(), 0, false, it->isdir};
        if (it->name.size() <= UINT32_MAX) {
            ref.foldedSize = static_cast<uint32_t>(FoldAsciiPrefix(it->name, &folded, &ref.ascii));
        }
        refs.push_back(ref);
    }
    // The same strict weak order as EnumCompare, and stable like the list's own sort: the same
    // result, ties in reader order.
    std::stable_sort(refs.begin(), refs.end(), RefLess(rule, folded));
    std::list<DIRENTRY_INFO> sorted;
    for (const SortRef &ref : refs) {
        sorted.splice(sorted.end(), list, ref.it);
    }
    list.swap(sorted);
}

}  // namespace

void NvoEnum::EntryListSort(std::list<DIRENTRY_INFO> &list, std::string key) {
    if (list.empty()) {
        return;
    }
    try {
        SortByRefs(list, RuleOf(key));
        return;
    } catch (...) {
        // Out of memory for the references: the list is untouched; sort it in place instead.
    }
    const EnumCompare compare(std::move(key));
    // The list's own merge sort is stable; by reference, so the merges never copy the key.
    // Only the comparator can throw (it doesn't), so nothing escapes here.
    list.sort(std::cref(compare));
}
