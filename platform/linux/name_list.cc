#include "name_list.h"

#include <algorithm>

#include "nss.h"
#include "text_util.h"
#include "vlibc_err.h"

namespace norvo::platform {

namespace {

bool IsSeparator(char c) {
    return c == ',' || IsSpaceByte(c);
}

}  // namespace

std::vector<std::string> SplitNameList(std::string_view text) {
    std::vector<std::string> entries;
    std::string current;
    bool quoted = false;
    for (char c : text) {
        if (c == '"') {
            quoted = !quoted;
        } else if (!quoted && IsSeparator(c)) {
            if (!current.empty()) {
                entries.push_back(std::move(current));
                current.clear();
            }
        } else {
            current += c;
        }
    }
    if (!current.empty()) {
        entries.push_back(std::move(current));
    }
    return entries;
}

std::string NormalizeNameList(std::string_view text) {
    std::string out;
    for (const std::string &entry : SplitNameList(text)) {
        if (!out.empty()) {
            out += ',';
        }
        if (std::any_of(entry.begin(), entry.end(), IsSeparator)) {
            out += '"' + entry + '"';
        } else {
            out += entry;
        }
    }
    return out;
}

bool ListMatcher::MatchesName(std::string_view entry) const {
    return !entry.empty() && entry.front() != '@' && EqualsIgnoreCase(entry, user_);
}

int ListMatcher::Matches(std::string_view entry) {
    if (entry.empty()) {
        return 0;
    }
    if (entry.front() != '@') {
        return MatchesName(entry) ? 1 : 0;
    }
    std::string groupName(entry.substr(1));
    if (groupName.empty()) {
        return 0;
    }
    if (LoadGroups() != 0) {
        return -1;
    }
    if (gids_.empty()) {
        return 0;
    }
    NssGroup group;
    int err = 0;
    switch (FindGroupByName(groupName, &group, &err)) {
        case NssStatus::kFound:
            return std::find(gids_.begin(), gids_.end(), group.gid) != gids_.end() ? 1 : 0;
        case NssStatus::kNotFound:
            return 0;
        case NssStatus::kFailed:
            break;
    }
    QUIB_SET_ERR(NssFailureCode(err));
    return -1;
}

int ListMatcher::LoadGroups() {
    if (loaded_) {
        return 0;
    }
    NssUser user = account_;
    int err = 0;
    switch (haveAccount_ ? NssStatus::kFound : FindUserByName(user_, &user, &err)) {
        case NssStatus::kFound:
            if (!GroupIdsOf(user, &gids_)) {
                QUIB_SET_ERR(QUIB_ERR_FAILED);
                return -1;
            }
            break;
        case NssStatus::kNotFound:
            gids_.clear();
            break;
        case NssStatus::kFailed:
            QUIB_SET_ERR(NssFailureCode(err));
            return -1;
    }
    loaded_ = true;
    return 0;
}

}  // namespace norvo::platform
