#include "norvoenum/kept_entries.h"

#include <string.h>

namespace norvo {
namespace {

// The rule's field, as SortFactsOf reads it from a record filled with the same facts.
int64_t SortValueOf(SortRule rule, const EntryFacts &facts) {
    switch (rule) {
        case SortRule::kSize:
            return facts.isdir ? 0 : static_cast<int64_t>(facts.size);
        case SortRule::kMtime:
            return facts.mtime;
        case SortRule::kCrtime:
            return facts.crtime;
        case SortRule::kCtime:
            return facts.ctime;
        case SortRule::kAtime:
            return facts.atime;
        case SortRule::kUser:
            return facts.uid;
        case SortRule::kGroup:
            return facts.gid;
        case SortRule::kPosix:
            return facts.mode & 0x1FFu;
        default:
            return 0;
    }
}

}  // namespace

size_t KeptEntries::Append(const std::string &text) {
    const size_t at = text_.size();
    text_.append(text);
    text_.push_back('\0');
    return at;
}

void KeptEntries::Add(const char *name, const EntryFacts &facts) {
    const size_t textBefore = text_.size();
    try {
        Kept kept{};
        scratch_.assign(name);
        kept.nameSize = scratch_.size();
        kept.nameAt = Append(scratch_);
        scratch_.clear();
        if ((info_ & NVO_INFO_TYPE) != 0 && !facts.isdir) {
            LowerExtension(name, &scratch_);
        }
        kept.typeSize = scratch_.size();
        kept.typeAt = Append(scratch_);
        kept.sortValue = SortValueOf(rule_, facts);
        kept.facts = facts;
        kept_.push_back(kept);
    } catch (...) {
        text_.resize(textBefore);  // all or nothing
        throw;
    }
}

SortFacts KeptEntries::FactsAt(size_t i) const {
    const Kept &kept = kept_[i];
    return SortFacts{text_.data() + kept.nameAt, text_.data() + kept.typeAt, kept.sortValue,
                     kept.facts.isdir};
}

void KeptEntries::Build(size_t i, const std::string &userDir, const std::string &realDir,
                        NorvoUserEnum &names, DIRENTRY_INFO &entry) const {
    const Kept &kept = kept_[i];
    const EntryFacts &facts = kept.facts;
    entry.name.assign(text_, kept.nameAt, kept.nameSize);
    entry.path.reserve(userDir.size() + 1 + kept.nameSize);
    entry.path.append(userDir).append(1, '/').append(entry.name);
    if (info_ & NVO_INFO_REAL_PATH) {
        entry.real_path.reserve(realDir.size() + 1 + kept.nameSize);
        entry.real_path.append(realDir).append(1, '/').append(entry.name);
    }
    entry.isdir = facts.isdir;
    entry.type.assign(text_, kept.typeAt, kept.typeSize);
    // An unreachable mount shows as such whatever was asked; otherwise the flags decide.
    if ((info_ & NVO_INFO_MOUNT_POINT_TYPE) != 0 || strcmp(facts.mountPointType, "remotefail") == 0) {
        entry.mount_point_type = facts.mountPointType;
    }
    CopyFacts(facts, info_, names, &entry);
}

}  // namespace norvo
