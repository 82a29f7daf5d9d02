// The order of listed entries: directories first, then the sort key's field, then the
// case-insensitive name. The key is decoded once per comparison object, not per comparison.
#include <functional>
#include <string>
#include <utility>

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

void NvoEnum::EntryListSort(std::list<DIRENTRY_INFO> &list, std::string key) {
    if (list.empty()) {
        return;
    }
    const EnumCompare compare(std::move(key));
    // The list's own merge sort is stable; by reference, so the merges never copy the key.
    // Only the comparator can throw (it doesn't), so nothing escapes here.
    list.sort(std::cref(compare));
}
