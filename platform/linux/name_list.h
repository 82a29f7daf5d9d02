// The user lists of shares and application privileges: entries separated by commas and white
// space, "@name" for a group, double quotes around an entry that holds separators
// ("@CORP\domain users").
#pragma once
#include <sys/types.h>

#include <string>
#include <string_view>
#include <vector>

#include "nss.h"

namespace norvo::platform {

// The entries of text with their quotes removed; empty entries are dropped. An unterminated
// quote runs to the end of the text.
[[nodiscard]] std::vector<std::string> SplitNameList(std::string_view text);
// The form share records carry: entries joined by ',' without spaces; an entry holding a
// separator is wrapped in double quotes, so SplitNameList gives the same entries back.
[[nodiscard]] std::string NormalizeNameList(std::string_view text);

// Decides whether list entries denote one user, looking the user's groups up at most once.
class ListMatcher {
public:
    explicit ListMatcher(std::string user) : user_(std::move(user)) {}
    // The user's account already found by the caller, so groups need no second lookup.
    ListMatcher(std::string user, const NssUser &account)
        : user_(std::move(user)), account_(account), haveAccount_(true) {}

    // 1 when entry names the user (ASCII case ignored) or is "@group" of a group the user
    // belongs to (primary or supplementary); 0 when not, also for an unknown user or group;
    // -1 when NSS failed (error slot set).
    [[nodiscard]] int Matches(std::string_view entry);
    // Only the name comparison, never NSS.
    [[nodiscard]] bool MatchesName(std::string_view entry) const;

private:
    // 0 when gids_ is ready (empty for an unknown user), -1 on NSS failure.
    int LoadGroups();

    std::string user_;
    NssUser account_;
    bool haveAccount_ = false;
    bool loaded_ = false;
    std::vector<gid_t> gids_;
};

}  // namespace norvo::platform
