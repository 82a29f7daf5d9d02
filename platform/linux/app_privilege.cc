// Application privileges, from QUIB_APP_PRIVILEGE_CONF in the settings-file form:
//   QUIB.TVQ.App.Tovana3.Instance="alice,@staff,!bob,!@interns"
// A holder is a user or "@group"; "!" denies, and a denial wins over any grant. Members of the
// administrators group hold every privilege, whatever the file says (intended).
#include <errno.h>
#include <string.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include "app_privilege.h"

#include "api_guard.h"
#include "name_list.h"
#include "nss.h"
#include "parsed_file.h"
#include "quib_paths.h"
#include "quib_user.h"
#include "settings_format.h"
#include "text_util.h"

namespace norvo::platform {
namespace {

bool IsAcceptablePrivilege(const char *priv) {
    if (priv == nullptr || priv[0] == '\0') {
        return false;
    }
    size_t len = strnlen(priv, kMaxSettingsKeyLength + 1);
    return len <= kMaxSettingsKeyLength && IsValidUtf8(std::string_view(priv, len));
}

// 1 granted, 0 not granted or denied, -1 when a holder could not be checked (slot set):
// the caller then refuses, since that holder might have been a denial.
int Decide(const std::string &holders, ListMatcher *matcher) {
    bool granted = false;
    bool failed = false;
    for (const std::string &entry : SplitNameList(holders)) {
        bool deny = entry.front() == '!';
        int match = matcher->Matches(deny ? std::string_view(entry).substr(1) : std::string_view(entry));
        if (match < 0) {
            failed = true;
        } else if (match == 1 && deny) {
            return 0;
        } else if (match == 1) {
            granted = true;
        }
    }
    if (failed) {
        return -1;
    }
    return granted ? 1 : 0;
}

int HasPrivilege(const char *userName, const char *priv) {
    NssUser user;
    int err = 0;
    switch (FindUserByName(userName, &user, &err)) {
        case NssStatus::kFound:
            break;
        case NssStatus::kNotFound:
            return 0;
        case NssStatus::kFailed:
            QUIB_SET_ERR(NssFailureCode(err));
            return 0;
    }
    ListMatcher matcher(userName, user);
    // The file first: a grant there makes the administrators' own lookup needless.
    static ParsedFile<std::vector<SettingsLine>> file(QUIB_APP_PRIVILEGE_CONF, ParseSettings);
    std::shared_ptr<const std::vector<SettingsLine>> lines;
    if (int readErr = file.Get(&lines); readErr != 0) {
        if (readErr != ENOENT) {
            QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
        }
    } else if (PrivilegeVerdict(*lines, priv, &matcher) == 1) {
        return 1;
    }
    return matcher.Matches(std::string("@") + QUIB_ADMIN_GROUP) == 1 ? 1 : 0;
}

}  // namespace

bool IsIntactPrivilegeLine(const SettingsLine &line) {
    if (!IsCleanConfigText(line.text)) {
        return false;
    }
    std::string_view body = TrimSpace(line.text);
    std::string_view rest = TrimSpace(body.substr(body.find('=') + 1));
    std::string_view after;
    if (!rest.empty() && rest.front() == '"') {
        size_t i = 1;
        for (; i < rest.size() && rest[i] != '"'; ++i) {
            if (rest[i] == '\\' && i + 1 < rest.size() && (rest[i + 1] == '"' || rest[i + 1] == '\\')) {
                ++i;
            }
        }
        if (i >= rest.size()) {
            return false;
        }
        after = TrimSpace(rest.substr(i + 1));
    } else if (!rest.empty() && rest.front() == '\'') {
        const size_t close = rest.find('\'', 1);
        if (close == std::string_view::npos) {
            return false;
        }
        after = TrimSpace(rest.substr(close + 1));
    }
    if (!after.empty() && after.front() != '#') {
        return false;
    }
    return std::count(line.value.begin(), line.value.end(), '"') % 2 == 0;
}

int PrivilegeVerdict(const std::vector<SettingsLine> &lines, std::string_view priv, ListMatcher *matcher) {
    const SettingsLine *entry = FindSettingsEntry(lines, priv, false);
    if (entry == nullptr || !IsIntactPrivilegeLine(*entry)) {
        return 0;
    }
    return Decide(entry->value, matcher);
}
}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" {

int VLIBUserPrivilegeHas(const char *user, const char *priv) {
    if (!np::IsAcceptableName(user) || !np::IsAcceptablePrivilege(priv)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return 0;
    }
    return np::Guarded(0, [&] { return np::HasPrivilege(user, priv); });
}

}  // extern "C"
