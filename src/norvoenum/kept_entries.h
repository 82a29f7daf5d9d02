// The records a directory listing keeps, held compactly until its page is cut, so that only the
// page's records are ever built: a listing of 100,000 entries that returns 100 allocates and
// frees 100 records, not 100,000.
#pragma once
#include <stddef.h>
#include <stdint.h>

#include <string>
#include <unordered_map>
#include <vector>

#include "norvo/norvoenum.h"
#include "norvoenum/entry_order.h"

namespace norvo {

class KeptEntries {
public:
    // rule: the sort rule whose value each record's facts carry.
    explicit KeptEntries(SortRule rule) : rule_(rule) {}

    // Keeps what FillFileInfo sets in a record: name, isdir, type, size, mode, ACL privilege
    // and mode, times, owner ids and names, mount point type. The paths and the share
    // listing's fields are not kept (a directory listing sets the paths itself, once the page
    // is cut). Throws std::bad_alloc.
    void Add(const DIRENTRY_INFO &entry);

    size_t Size() const { return kept_.size(); }

    // The sort facts of record i; its strings stay valid until the next Add.
    SortFacts FactsAt(size_t i) const;

    // Sets in a fresh entry what Add kept of record i.
    void Restore(size_t i, DIRENTRY_INFO &entry) const;

private:
    struct Kept {
        size_t nameAt;  // in text_, NUL-terminated there
        size_t nameSize;
        size_t typeAt;
        size_t typeSize;
        uint64_t size;
        int64_t sortValue;
        uint32_t mode;
        uint32_t aclPrivilege;
        int32_t mtime, ctime, crtime, atime;
        uint32_t uid, gid;
        uint32_t user, group, mountPointType;  // in words_
        bool isdir;
        bool isAclMode;
    };

    // The index of text in words_, added when new; *hint is the index the caller found last.
    uint32_t Intern(const std::string &text, uint32_t *hint);
    size_t Append(const std::string &text);

    SortRule rule_;
    std::vector<Kept> kept_;
    std::string text_;                // names and types, each followed by a NUL
    std::vector<std::string> words_;  // owner names and mount point types: few distinct ones
    std::unordered_map<std::string, uint32_t> wordIndex_;
    uint32_t userHint_ = 0, groupHint_ = 0, mountHint_ = 0;
};

}  // namespace norvo
