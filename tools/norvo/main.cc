// norvo: asks the library what a request of the web file manager would get.
#include <exception>
#include <iostream>

#include "args.h"
#include "exit_status.h"
#include "help.h"
#include "output.h"

int main(int argc, char **argv) {
    using namespace norvo::cli;
    // Nothing here writes through stdio: cout may keep a buffer of its own, which a long
    // listing writes several times faster.
    std::ios::sync_with_stdio(false);
    int status = kExitFailure;
    try {
        const ParseOutcome outcome = ParseCommandLine(argc, argv);
        switch (outcome.kind) {
            case ParseOutcome::kHelp:
                if (outcome.topic != nullptr) {
                    PrintCommandHelp(std::cout, *outcome.topic);
                } else {
                    PrintOverview(std::cout);
                }
                status = kExitOk;
                break;
            case ParseOutcome::kUsageError:
                status = ReportUsageError(outcome.topic, outcome.error);
                break;
            case ParseOutcome::kRun:
                status = outcome.invocation.command->handler(outcome.invocation);
                break;
        }
    } catch (const std::exception &e) {
        std::cerr << "norvo: internal error: " << e.what() << '\n';
        return kExitFailure;
    }
    // A result that could not be written was not given.
    std::cout.flush();
    if (!std::cout) {
        std::cerr << "norvo: cannot write the output\n";
        return kExitFailure;
    }
    return status;
}
