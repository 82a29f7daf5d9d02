#include "norvoenum/kept_entries.h"

#include <limits>
#include <new>

namespace norvo {

uint32_t KeptEntries::Intern(const std::string &text, uint32_t *hint) {
    if (*hint < words_.size() && words_[*hint] == text) {
        return *hint;
    }
    const auto found = wordIndex_.find(text);
    if (found != wordIndex_.end()) {
        *hint = found->second;
        return found->second;
    }
    if (words_.size() >= std::numeric_limits<uint32_t>::max()) {
        throw std::bad_alloc();
    }
    const auto index = static_cast<uint32_t>(words_.size());
    words_.push_back(text);
    wordIndex_.emplace(text, index);
    *hint = index;
    return index;
}

size_t KeptEntries::Append(const std::string &text) {
    const size_t at = text_.size();
    text_.append(text);
    text_.push_back('\0');
    return at;
}

void KeptEntries::Add(const DIRENTRY_INFO &entry) {
    Kept kept{};
    const size_t textBefore = text_.size();
    try {
        kept.nameAt = Append(entry.name);
        kept.nameSize = entry.name.size();
        kept.typeAt = Append(entry.type);
        kept.typeSize = entry.type.size();
        kept.user = Intern(entry.user, &userHint_);
        kept.group = Intern(entry.group, &groupHint_);
        kept.mountPointType = Intern(entry.mount_point_type, &mountHint_);
        kept.size = entry.size;
        kept.sortValue = SortFactsOf(rule_, entry).value;
        kept.mode = entry.mode;
        kept.aclPrivilege = entry.acl_privilege;
        kept.mtime = entry.mtime;
        kept.ctime = entry.ctime;
        kept.crtime = entry.crtime;
        kept.atime = entry.atime;
        kept.uid = entry.uid;
        kept.gid = entry.gid;
        kept.isdir = entry.isdir;
        kept.isAclMode = entry.is_acl_mode;
        kept_.push_back(kept);
    } catch (...) {
        text_.resize(textBefore);  // all or nothing
        throw;
    }
}

SortFacts KeptEntries::FactsAt(size_t i) const {
    const Kept &kept = kept_[i];
    return SortFacts{text_.data() + kept.nameAt, text_.data() + kept.typeAt, kept.sortValue, kept.isdir};
}

void KeptEntries::Restore(size_t i, DIRENTRY_INFO &entry) const {
    const Kept &kept = kept_[i];
    entry.name.assign(text_, kept.nameAt, kept.nameSize);
    entry.type.assign(text_, kept.typeAt, kept.typeSize);
    entry.user = words_[kept.user];
    entry.group = words_[kept.group];
    entry.mount_point_type = words_[kept.mountPointType];
    entry.size = kept.size;
    entry.mode = kept.mode;
    entry.acl_privilege = kept.aclPrivilege;
    entry.mtime = kept.mtime;
    entry.ctime = kept.ctime;
    entry.crtime = kept.crtime;
    entry.atime = kept.atime;
    entry.uid = kept.uid;
    entry.gid = kept.gid;
    entry.isdir = kept.isdir;
    entry.is_acl_mode = kept.isAclMode;
}

}  // namespace norvo
