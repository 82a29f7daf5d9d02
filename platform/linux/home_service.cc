// The home service: per-kind switches and the homes root in QUIB_INFO_CONF.
//   userHomeEnable="yes"        local accounts
//   domainUserHomeEnable="yes"  domain accounts
//   ldapUserHomeEnable="yes"    directory accounts
//   userHomeRoot="/volume1/homes"
#include <errno.h>
#include <string.h>

#include <memory>
#include <string>
#include <vector>

#include "api_guard.h"
#include "home_service.h"
#include "locked_file.h"
#include "quib_paths.h"
#include "quib_user.h"
#include "settings_format.h"
#include "text_util.h"

namespace norvo::platform {
namespace {

struct HomeSettings {
    bool local = false;
    bool domain = false;
    bool directory = false;
    std::string root;  // normalised; "" when unset or not absolute
};

bool IsOn(const std::vector<SettingsLine> &lines, const char *key) {
    const SettingsLine *entry = FindSettingsEntry(lines, key, false);
    bool on = false;
    return entry != nullptr && ParseBool(entry->value, &on) && on;
}

// A missing settings file means the service was never turned on. false with 0x0900 when the
// file exists but can't be read.
bool LoadHomeSettings(HomeSettings *settings) {
    std::string text;
    if (int err = ReadWholeFile(QUIB_INFO_CONF, &text); err != 0) {
        if (err == ENOENT) {
            return true;
        }
        QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
        return false;
    }
    std::vector<SettingsLine> lines = ParseSettings(text);
    settings->local = IsOn(lines, "userHomeEnable");
    settings->domain = IsOn(lines, "domainUserHomeEnable");
    settings->directory = IsOn(lines, "ldapUserHomeEnable");
    if (const SettingsLine *root = FindSettingsEntry(lines, "userHomeRoot", false); root != nullptr) {
        settings->root = NormalizePath(root->value);
        if (settings->root == "/") {
            settings->root.clear();  // every home would be "below" it
        }
    }
    return true;
}

struct UserFree {
    void operator()(PQUIBUSER user) const { QUIBUserFree(user); }
};

bool EnabledFor(const HomeSettings &settings, AUTH_TYPE kind) {
    switch (kind) {
        case AUTH_DOMAIN:
            return settings.domain;
        case AUTH_LDAP:
            return settings.directory;
        default:
            return settings.local;
    }
}

enum class Home { kYes, kNo, kFailed };

// Whether user has a home folder, and its normalised path in *home. kFailed with 0x0900 when
// the settings can't be read.
Home HomeOf(const QUIBUSER &user, std::string *home) {
    HomeSettings settings;
    if (!LoadHomeSettings(&settings)) {
        return Home::kFailed;
    }
    // A record built by hand may carry no kind; the name tells it then.
    AUTH_TYPE kind = user.authType;
    if (kind != AUTH_LOCAL && kind != AUTH_DOMAIN && kind != AUTH_LDAP) {
        kind = QUIBUserAuthTypeOf(user.szName);
    }
    if (settings.root.empty() || !EnabledFor(settings, kind) || user.szHome == nullptr) {
        return Home::kNo;
    }
    *home = NormalizePath(user.szHome);
    return !home->empty() && *home != settings.root && PathIsWithin(settings.root, *home) ? Home::kYes
                                                                                          : Home::kNo;
}

}  // namespace

bool HomesRoot(std::string *root) {
    HomeSettings settings;
    if (!LoadHomeSettings(&settings)) {
        return false;
    }
    *root = settings.root;
    return true;
}

}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" {

int QUIBServiceUserHomeIsEnabled(const PQUIBUSER user) {
    if (user == nullptr || user->szName == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return 0;
    }
    return np::Guarded(0, [&] {
        std::string home;
        return np::HomeOf(*user, &home) == np::Home::kYes ? 1 : 0;
    });
}

int QUIBServiceHomePathGet(const char *user, char *buf, int size) {
    if (user == nullptr || buf == nullptr || size <= 0) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        PQUIBUSER raw = nullptr;
        if (QUIBUserGet(user, &raw) != 0) {
            return -1;  // the slot says why: 0x1D00 unknown, 0x0D00 a bad name, NSS codes
        }
        const std::unique_ptr<QUIBUSER, np::UserFree> record(raw);
        std::string home;
        switch (np::HomeOf(*record, &home)) {
            case np::Home::kFailed:
                return -1;
            case np::Home::kNo:
                QUIB_SET_ERR(QUIB_ERR_NO_PATH);
                return -1;
            case np::Home::kYes:
                break;
        }
        if (home.size() + 1 > static_cast<size_t>(size)) {
            QUIB_SET_ERR(QUIB_ERR_NAME_TOO_LONG);
            return -1;
        }
        memcpy(buf, home.c_str(), home.size() + 1);
        return 0;
    });
}

}  // extern "C"
