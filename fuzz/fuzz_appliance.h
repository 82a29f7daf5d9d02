// The throwaway appliance a fuzzer runs in, built once from LLVMFuzzerInitialize: the private
// mount namespace keeps every file the fuzzer writes, and every account and share it reads,
// away from the host. It lives as long as the process.
#pragma once
#include <functional>

#include "appliance.h"

namespace norvo::fuzz {

// Builds the appliance, lets setup configure it, and drops its syslog lines as they arrive
// (a long run logs millions). Call once.
inline norvo::testing::Appliance &BuildAppliance(
    const std::function<void(norvo::testing::Appliance &)> &setup) {
    static auto *appliance = new norvo::testing::Appliance();
    setup(*appliance);
    appliance->ForwardLogs([](const norvo::testing::LogLine &) {});
    return *appliance;
}

}  // namespace norvo::fuzz
