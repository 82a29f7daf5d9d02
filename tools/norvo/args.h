// The command line: "norvo [--json] COMMAND [OPTIONS] ARGUMENTS", parsed by hand so every
// mistake gets its own message and nothing is consumed silently.
#pragma once
#include <string>

#include "command.h"

namespace norvo::cli {

struct ParseOutcome {
    enum Kind { kRun, kHelp, kUsageError };
    Kind kind = kUsageError;
    Invocation invocation;              // kRun
    const CommandDef *topic = nullptr;  // kHelp: null for the overview; kUsageError: the command, if known
    std::string error;                  // kUsageError: one line, not yet made terminal-safe
};

// Options may be written "--name VALUE" or "--name=VALUE". A separate value may not begin with
// "--" (write "--user=--odd" for that), so a forgotten value never swallows the next option.
// "--" ends the options; --json and -h/--help are accepted before and after the command.
// --escaped, after a command that takes paths, says that its arguments and PATH options are in
// the escaped form norvo prints (see TerminalSafe); they are decoded here.
ParseOutcome ParseCommandLine(int argc, const char *const *argv);

// Whether the option's value is a path, and whether the command takes any (and so --escaped).
bool IsPath(const OptionDef &option);
bool TakesPaths(const CommandDef &command);

}  // namespace norvo::cli
