// What a subcommand is (its options, arguments, help and handler) and one parsed invocation.
#pragma once
#include <map>
#include <string>
#include <vector>

namespace norvo::cli {

struct Invocation;
// Runs a parsed invocation; returns the exit status (see exit_status.h).
using Handler = int (*)(const Invocation &);

struct OptionDef {
    const char *name;       // without the leading "--"
    const char *valueName;  // "USER"; null for a flag
    bool required;
    const char *help;
};

struct ArgumentDef {
    const char *name;  // "PATH"; every argument is required, but a last one named "FILE..."
                       // takes any number of values, none included
    const char *help;
};

inline bool IsRepeated(const ArgumentDef &argument) {
    const std::string name = argument.name;
    return name.size() > 3 && name.compare(name.size() - 3, 3, "...") == 0;
}

struct CommandDef {
    const char *name;
    const char *summary;  // one line for "norvo --help"
    const char *details;  // paragraphs for "norvo NAME --help"
    std::vector<OptionDef> options;
    std::vector<ArgumentDef> arguments;
    Handler handler;
};

struct Invocation {
    const CommandDef *command = nullptr;
    bool json = false;
    std::map<std::string, std::string> options;  // given options; flags map to ""
    std::vector<std::string> arguments;

    bool Has(const std::string &name) const { return options.count(name) != 0; }
    // The option's value, or null when it was not given.
    const std::string *Value(const std::string &name) const {
        const auto found = options.find(name);
        return found == options.end() ? nullptr : &found->second;
    }
    // The option's value for a C interface: null when it was not given.
    const char *CStr(const std::string &name) const {
        const std::string *value = Value(name);
        return value == nullptr ? nullptr : value->c_str();
    }
};

// Every subcommand, in the order "norvo --help" lists them.
const std::vector<CommandDef> &Commands();
const CommandDef *FindCommand(const std::string &name);

}  // namespace norvo::cli
