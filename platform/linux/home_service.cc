// The home service: per-kind switches and the homes root in QUIB_INFO_CONF.
//   userHomeEnable="yes"        local accounts
//   domainUserHomeEnable="yes"  domain accounts
//   ldapUserHomeEnable="yes"    directory accounts
//   userHomeRoot="/volume1/homes"
#include <errno.h>
#include <string.h>

#include <string>
#include <vector>

#include "api_guard.h"
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
    if (int err = ReadLockedFile(QUIB_INFO_CONF, &text); err != 0) {
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

}  // namespace
}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" {

int QUIBServiceUserHomeIsEnabled(const PQUIBUSER user) {
    if (user == nullptr || user->szName == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return 0;
    }
    return np::Guarded(0, [&] {
        np::HomeSettings settings;
        if (!np::LoadHomeSettings(&settings) || settings.root.empty()) {
            return 0;
        }
        // A record built by hand may carry no kind; the name tells it then.
        AUTH_TYPE kind = user->authType;
        if (kind != AUTH_LOCAL && kind != AUTH_DOMAIN && kind != AUTH_LDAP) {
            kind = QUIBUserAuthTypeOf(user->szName);
        }
        if (!np::EnabledFor(settings, kind) || user->szHome == nullptr) {
            return 0;
        }
        std::string home = np::NormalizePath(user->szHome);
        return !home.empty() && home != settings.root && np::PathIsWithin(settings.root, home) ? 1 : 0;
    });
}

int QUIBServiceHomePathGet(char *buf, int size) {
    if (buf == nullptr || size <= 0) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        np::HomeSettings settings;
        if (!np::LoadHomeSettings(&settings)) {
            return -1;
        }
        if (settings.root.empty() || !(settings.local || settings.domain || settings.directory)) {
            QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
            return -1;
        }
        if (settings.root.size() + 1 > static_cast<size_t>(size)) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return -1;
        }
        memcpy(buf, settings.root.c_str(), settings.root.size() + 1);
        return 0;
    });
}

}  // extern "C"
