// The shared-folder configuration (QUIB_SHARE_CONF) in smb.conf syntax, parsed into shares.
#pragma once
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace norvo::platform {

struct ShareEntry {
    std::string name;
    std::string path;  // normalised, absolute, never "/"
    std::string comment;
    std::string noAccess;  // NormalizeNameList form
    std::string readWrite;
    std::string readOnly;
    unsigned status = 0;    // SHARE_STATUS_*
    unsigned restrict = 0;  // SHARE_RESTRICT_*
    int ftpPrivilege = 0;   // 0 none, 1 read-only, 2 read-write
    bool aclMode = true;
    bool synced = false;  // "synced = yes": synchronised to another appliance
};

// The shares of text in file order. Sections that can't be trusted are skipped whole, so a
// typo or a damaged byte never loosens a share's restrictions: a line without "=", a control
// character (NUL included) or invalid UTF-8 in a line, a key that is not plain ASCII, an
// unbalanced double quote in a value or any quote in a path, a bad value of a known key, a
// missing or relative path, an unusable name, or a name given to two sections (both skipped).
// A leading UTF-8 byte-order mark is ignored.
// [global] and lines before the first section are ignored; unknown keys are ignored.
[[nodiscard]] std::vector<ShareEntry> ParseShareConfig(std::string_view text);

// The shares of one version of the configuration, with their names indexed.
struct ShareTable {
    std::vector<ShareEntry> shares;
    std::unordered_map<std::string, size_t> byLowerName;

    // The share named name (ASCII case ignored); null when none.
    [[nodiscard]] const ShareEntry *Find(std::string_view name) const;
};
[[nodiscard]] ShareTable MakeShareTable(std::string_view text);

// The parsed QUIB_SHARE_CONF of this process, read again only when the file changes.
// 0 and *table, or the errno of the read.
[[nodiscard]] int CurrentShares(std::shared_ptr<const ShareTable> *table);

}  // namespace norvo::platform
