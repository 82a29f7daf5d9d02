// The shared-folder configuration (QUIB_SHARE_CONF) in smb.conf syntax, parsed into shares.
#pragma once
#include <string>
#include <string_view>
#include <vector>

namespace norvo::platform {

struct ShareEntry {
    std::string name;
    std::string path;  // normalised, absolute, never "/"
    std::string comment;
    std::string noAccess;   // NormalizeNameList form
    std::string readWrite;
    std::string readOnly;
    unsigned status = 0;    // SHARE_STATUS_*
    unsigned restrict = 0;  // SHARE_RESTRICT_*
    int ftpPrivilege = 0;   // 0 none, 1 read-only, 2 read-write
    bool aclMode = true;
    bool synced = false;    // "synced = yes": synchronised to another appliance
};

// The shares of text in file order. Sections that can't be trusted are skipped whole, so a
// typo never loosens a share's restrictions: a line without "=", a bad value of a known key, a
// missing or relative path, an unusable name, or a name given to two sections (both skipped).
// [global] and lines before the first section are ignored; unknown keys are ignored.
[[nodiscard]] std::vector<ShareEntry> ParseShareConfig(std::string_view text);

}  // namespace norvo::platform
