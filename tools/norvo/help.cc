#include "help.h"

#include <algorithm>
#include <string>

#include "args.h"

namespace norvo::cli {
namespace {

constexpr char kOutputNote[] =
    "output:\n"
    "  Aligned text by default. With --json, one JSON object on stdout:\n"
    "    {\"success\":true,\"data\":{...}}\n"
    "    {\"success\":false,\"error\":{\"code\":408,\"key\":\"error:error_no_path\"}}\n"
    "  In text, a failure prints \"error 408 (error:error_no_path)\" on stderr.\n"
    "names:\n"
    "  Text shows names and paths in the escaped form: \\xNN for each byte of malformed UTF-8\n"
    "  and of control, format (bidi, zero-width) and line-separator characters, and \\\\ for a\n"
    "  backslash that would otherwise begin an escape; ordinary names are unchanged. JSON\n"
    "  strings are valid UTF-8 (a bad byte becomes U+FFFD); a member whose value was not gets a\n"
    "  sibling \"<key>_escaped\" with the escaped form.\n"
    "  --escaped makes a command read its paths in that form.\n"
    "exit status:\n"
    "  0 success; 1 the library (or the system) refused or failed, with its code and key;\n"
    "  2 wrong command line (message on stderr, nothing asked).\n";

std::string OptionLabel(const OptionDef &option) {
    std::string label = std::string("--") + option.name;
    if (option.valueName != nullptr) {
        label += std::string(" ") + option.valueName;
    }
    return label;
}

void PrintRows(std::ostream &out, const std::vector<std::pair<std::string, std::string>> &rows) {
    size_t width = 0;
    for (const auto &row : rows) {
        width = std::max(width, row.first.size());
    }
    for (const auto &row : rows) {
        out << "  " << row.first << std::string(width - row.first.size() + 2, ' ') << row.second << '\n';
    }
}

}  // namespace

void PrintUsageLine(std::ostream &out, const CommandDef &command) {
    out << "usage: norvo " << command.name << " [--json]" << (TakesPaths(command) ? " [--escaped]" : "");
    for (const OptionDef &option : command.options) {
        out << ' ' << (option.required ? "" : "[") << OptionLabel(option) << (option.required ? "" : "]");
    }
    for (const ArgumentDef &argument : command.arguments) {
        out << ' ' << (IsRepeated(argument) ? "[" : "") << argument.name << (IsRepeated(argument) ? "]" : "");
    }
    out << '\n';
}

void PrintCommandHelp(std::ostream &out, const CommandDef &command) {
    PrintUsageLine(out, command);
    out << '\n' << command.summary << "\n\n" << command.details << '\n';
    if (!command.arguments.empty()) {
        std::vector<std::pair<std::string, std::string>> rows;
        for (const ArgumentDef &argument : command.arguments) {
            rows.emplace_back(argument.name, argument.help);
        }
        out << "\narguments:\n";
        PrintRows(out, rows);
    }
    std::vector<std::pair<std::string, std::string>> rows;
    for (const OptionDef &option : command.options) {
        rows.emplace_back(OptionLabel(option),
                          std::string(option.help) + (option.required ? " (required)" : ""));
    }
    rows.emplace_back("--json", "print one JSON object instead of text");
    if (TakesPaths(command)) {
        rows.emplace_back("--escaped", "paths are in the escaped form norvo prints (\\\\, \\xNN): see names");
    }
    rows.emplace_back("-h, --help", "show this help");
    out << "\noptions:\n";
    PrintRows(out, rows);
    out << '\n' << kOutputNote;
}

void PrintOverview(std::ostream &out) {
    out << "usage: norvo [--json] COMMAND [OPTIONS] ARGUMENTS\n"
           "       norvo COMMAND --help\n"
           "\n"
           "Asks the norvo library what a request of the web file manager would get: where a path\n"
           "leads, what a user may do there, whether a name or path may be created.\n"
           "\n"
           "commands:\n";
    std::vector<std::pair<std::string, std::string>> rows;
    for (const CommandDef &command : Commands()) {
        rows.emplace_back(command.name, command.summary);
    }
    rows.emplace_back("help COMMAND", "the same as norvo COMMAND --help");
    PrintRows(out, rows);
    out << '\n' << kOutputNote;
}

}  // namespace norvo::cli
