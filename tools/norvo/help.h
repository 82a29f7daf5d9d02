// The --help texts, made from the command table so they can't drift from the parser.
#pragma once
#include <ostream>

#include "command.h"

namespace norvo::cli {

void PrintOverview(std::ostream &out);
void PrintCommandHelp(std::ostream &out, const CommandDef &command);
// "usage: norvo NAME ..." alone, for the line after a usage error.
void PrintUsageLine(std::ostream &out, const CommandDef &command);

}  // namespace norvo::cli
