// The string hash behind VLIBCSzHash*, for the platform's own fillers (settings readers).
#pragma once
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "vlibc_szlist.h"

struct _tag_SZHASH_ {
    // Insertion order is the enumeration order; index maps a key to its slot.
    std::vector<std::pair<std::string, std::string>> entries;
    std::unordered_map<std::string, size_t> index;

    void Set(const std::string &key, const std::string &value) {
        auto found = index.find(key);
        if (found != index.end()) {
            entries[found->second].second = value;
            return;
        }
        entries.emplace_back(key, value);
        try {
            index.emplace(key, entries.size() - 1);
        } catch (...) {
            entries.pop_back();
            throw;
        }
    }
};
