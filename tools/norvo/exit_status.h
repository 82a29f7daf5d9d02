// Exit statuses of norvo.
#pragma once

namespace norvo::cli {

enum ExitStatus {
    kExitOk = 0,
    kExitFailure = 1,  // the library (or the system) refused or failed
    kExitUsage = 2,    // the command line was wrong; nothing was asked
};

}  // namespace norvo::cli
