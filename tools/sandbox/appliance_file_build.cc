#include "appliance_file.h"

namespace norvo::testing {

namespace {

using Kind = ApplianceStep::Kind;

// Generated content: readable, and different at every offset so truncation shows.
std::string Filler(long long size) {
    static const char kPattern[] = "0123456789abcdefghijklmnopqrstuvwxyz\n";
    std::string content;
    content.reserve(size_t(size));
    for (long long i = 0; i < size; ++i)
        content += kPattern[i % (sizeof kPattern - 1)];
    return content;
}

void Apply(Appliance &appliance, const ApplianceStep &step) {
    switch (step.kind) {
        case Kind::kBasic:
            appliance.Basic();
            break;
        case Kind::kUser:
        case Kind::kAdmin:
            appliance.AddUser(step.user);
            break;
        case Kind::kGroup:
            appliance.AddGroup(step.group);
            break;
        case Kind::kShare:
            appliance.AddShare(step.share);
            break;
        case Kind::kHome:
            appliance.SetHomeService(step.enabled, step.path, step.domain, step.directory);
            break;
        case Kind::kDomain:
            appliance.SetDomain(step.name);
            break;
        case Kind::kDirectory:
            appliance.SetDirectory(step.name);
            break;
        case Kind::kSetting:
            appliance.SetSetting(step.name, step.value);
            break;
        case Kind::kDefaultSetting:
            appliance.SetDefaultSetting(step.name, step.value);
            break;
        case Kind::kPrivilege:
            appliance.SetAppPrivilege(step.name, step.value);
            break;
        case Kind::kLink:
            appliance.AddSharingLink(step.link);
            break;
        case Kind::kVolume:
            appliance.AddVolume(step.path);
            break;
        case Kind::kReadOnly:
            appliance.RemountReadOnly(step.path);
            break;
        case Kind::kFat:
            appliance.MountFat(step.path);
            break;
        case Kind::kDeadRemote:
            appliance.MountDeadRemote(step.path);
            break;
        case Kind::kDir:
            appliance.MakeDir(step.path, step.owner, step.mode);
            break;
        case Kind::kFile:
            appliance.WriteFile(step.path, step.size >= 0 ? Filler(step.size) : step.value, step.owner,
                                step.mode);
            break;
    }
}

}  // namespace

void BuildAppliance(Appliance &appliance, const ApplianceFile &file) {
    for (const ApplianceStep &step : file.steps)
        if (step.kind != Kind::kReadOnly)
            Apply(appliance, step);
    for (const ApplianceStep &step : file.steps)
        if (step.kind == Kind::kReadOnly)
            Apply(appliance, step);
}

}  // namespace norvo::testing
