// String hashes: keys with one value each, enumerated in the order they were first set, so a
// settings file's keys come out in file order.
#include "szhash.h"

#include <stdlib.h>

#include <new>

#include "api_guard.h"

using norvo::platform::Guarded;

extern "C" {

PSZHASH VLIBCSzHashAlloc(int size) {
    return Guarded(static_cast<PSZHASH>(nullptr), [&] {
        auto *hash = new SZHASH;
        // A hint only: a hostile size must not turn into a huge allocation.
        if (size > 0) {
            hash->index.reserve(static_cast<size_t>(size < 65536 ? size : 65536));
        }
        return hash;
    });
}

void VLIBCSzHashFree(PSZHASH hash) {
    delete hash;
}

int VLIBCSzHashSetValue(PSZHASH hash, const char *key, const char *value) {
    if (hash == nullptr || key == nullptr || value == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return Guarded(-1, [&] {
        hash->Set(key, value);
        return 0;
    });
}

const char *VLIBCSzHashGetValue(PSZHASH hash, const char *key) {
    if (hash == nullptr || key == nullptr) {
        return nullptr;
    }
    return Guarded(static_cast<const char *>(nullptr), [&]() -> const char * {
        auto found = hash->index.find(key);
        return found == hash->index.end() ? nullptr : hash->entries[found->second].second.c_str();
    });
}

int VLIBCSzHashCount(PSZHASH hash) {
    return hash == nullptr ? 0 : static_cast<int>(hash->entries.size());
}

int VLIBCSzHashEnumKey(PSZHASH hash, PSZLIST *plist) {
    if (hash == nullptr || plist == nullptr || *plist == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    const int before = VLIBCSzListCount(*plist);
    for (const auto &entry : hash->entries) {
        if (VLIBCSzListPush(plist, entry.first.c_str()) != 0) {
            while ((*plist)->nItem > before) {
                free((*plist)->pszItem[--(*plist)->nItem]);
            }
            return -1;
        }
    }
    return static_cast<int>(hash->entries.size());
}

}  // extern "C"
