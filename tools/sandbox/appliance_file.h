// Appliance files: a declarative, line-oriented description of an appliance (the format is
// described with the norvo-sandbox command in the README), parsed completely and checked before
// anything is built, so a bad file never yields a half-built appliance.
#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>
#include <vector>

#include "appliance.h"

namespace norvo::testing {

// One directive of the file. Which fields count depends on kind (see each field).
struct ApplianceStep {
    enum class Kind {
        kBasic,
        kUser,
        kAdmin,
        kGroup,
        kShare,
        kHome,
        kDomain,
        kDirectory,
        kSetting,
        kDefaultSetting,
        kPrivilege,
        kVolume,
        kReadOnly,
        kFat,
        kDeadRemote,
        kDir,
        kFile,
        kLink,
    };
    Kind kind = Kind::kBasic;
    int line = 0;                // 1-based line in the file
    UserSpec user;               // kUser, kAdmin (kAdmin: "administrators" is among the groups)
    GroupSpec group;             // kGroup
    ShareSpec share;             // kShare
    bool enabled = false;        // kHome
    bool domain = true;          // kHome
    bool directory = true;       // kHome
    std::string name;            // kDomain workgroup, kDirectory server, kSetting/kDefaultSetting key,
                                 // kPrivilege privilege
    std::string value;           // kSetting/kDefaultSetting value, kPrivilege holders, kFile content
    long long size = -1;         // kFile: >= 0 for generated content of that many bytes
    std::string path;            // kHome root; kVolume, kReadOnly, kFat, kDeadRemote, kDir, kFile
    std::string owner = "root";  // kDir, kFile: "user" or "user:group"
    mode_t mode = 0;             // kDir (default 0755), kFile (default 0644)
    SharingLinkSpec link;        // kLink
};

struct ApplianceFile {
    std::vector<ApplianceStep> steps;  // in file order
};

// Parses text; origin names it in messages. On success returns true and fills *file. On the
// first error returns false with *error = "<origin>:<line>: <what is wrong>" and *file unchanged.
[[nodiscard]] bool ParseApplianceFile(std::string_view text, const std::string &origin, ApplianceFile *file,
                                      std::string *error);

// Builds file's appliance into appliance: the steps in order, except that read-only remounts
// come last (so files can still be placed below them). Aborts like the Appliance calls do.
void BuildAppliance(Appliance &appliance, const ApplianceFile &file);

}  // namespace norvo::testing
