#include "args.h"

#include <string.h>

#include <algorithm>

#include "text_safe.h"

namespace norvo::cli {
namespace {

ParseOutcome UsageError(const CommandDef *command, std::string message) {
    ParseOutcome outcome;
    outcome.kind = ParseOutcome::kUsageError;
    outcome.topic = command;
    outcome.error = std::move(message);
    return outcome;
}

ParseOutcome Help(const CommandDef *command) {
    ParseOutcome outcome;
    outcome.kind = ParseOutcome::kHelp;
    outcome.topic = command;
    return outcome;
}

constexpr char kNotEscaped[] =
    " is not in the escaped form: an escape is a backslash, x and two hex digits other than 00";

bool IsHelp(const std::string &arg) {
    return arg == "--help" || arg == "-h";
}

const OptionDef *FindOption(const CommandDef &command, const std::string &name) {
    for (const OptionDef &option : command.options) {
        if (name == option.name) {
            return &option;
        }
    }
    return nullptr;
}

// Parses what follows the command name into outcome.invocation.
ParseOutcome ParseCommandArgs(const CommandDef &command, bool json, int argc, const char *const *argv,
                              int first) {
    ParseOutcome outcome;
    outcome.kind = ParseOutcome::kRun;
    Invocation &inv = outcome.invocation;
    inv.command = &command;
    inv.json = json;
    bool optionsEnded = false;
    bool escaped = false;
    for (int i = first; i < argc; ++i) {
        const std::string arg = argv[i];
        if (optionsEnded || arg == "-" || arg.empty() || arg[0] != '-') {
            inv.arguments.push_back(arg);
            continue;
        }
        if (arg == "--") {
            optionsEnded = true;
            continue;
        }
        if (IsHelp(arg)) {
            return Help(&command);
        }
        if (arg.compare(0, 2, "--") != 0) {
            return UsageError(&command, "unknown option " + arg);
        }
        const size_t equals = arg.find('=');
        const std::string name = arg.substr(2, equals == std::string::npos ? std::string::npos : equals - 2);
        if (name == "escaped" && TakesPaths(command)) {
            if (equals != std::string::npos) {
                return UsageError(&command, "option --escaped takes no value");
            }
            escaped = true;
            continue;
        }
        if (name == "json") {
            if (equals != std::string::npos) {
                return UsageError(&command, "option --json takes no value");
            }
            inv.json = true;
            continue;
        }
        const OptionDef *option = FindOption(command, name);
        if (option == nullptr) {
            return UsageError(&command, "unknown option --" + name);
        }
        if (inv.Has(name)) {
            return UsageError(&command, "option --" + name + " given twice");
        }
        if (option->valueName == nullptr) {
            if (equals != std::string::npos) {
                return UsageError(&command, "option --" + name + " takes no value");
            }
            inv.options[name] = "";
            continue;
        }
        std::string value;
        if (equals != std::string::npos) {
            value = arg.substr(equals + 1);
        } else if (i + 1 < argc && strncmp(argv[i + 1], "--", 2) != 0) {
            value = argv[++i];
        } else {
            return UsageError(&command, "option --" + name + " needs a value (" + option->valueName + ")");
        }
        if (value.empty()) {
            return UsageError(&command, "option --" + name + " needs a non-empty value");
        }
        inv.options[name] = value;
    }
    for (const OptionDef &option : command.options) {
        if (option.required && !inv.Has(option.name)) {
            return UsageError(&command, std::string("option --") + option.name + " is required");
        }
    }
    const bool repeated = !command.arguments.empty() && IsRepeated(command.arguments.back());
    const size_t wanted = command.arguments.size() - (repeated ? 1 : 0);
    if (inv.arguments.size() < wanted) {
        return UsageError(&command,
                          std::string("missing argument ") + command.arguments[inv.arguments.size()].name);
    }
    if (!repeated && inv.arguments.size() > wanted) {
        return UsageError(&command, "unexpected argument " + inv.arguments[wanted]);
    }
    for (size_t i = 0; i < inv.arguments.size(); ++i) {
        if (inv.arguments[i].empty()) {
            const ArgumentDef &def = command.arguments[std::min(i, command.arguments.size() - 1)];
            return UsageError(&command, std::string("argument ") + def.name + " is empty");
        }
    }
    if (escaped) {
        // Decoded before anything looks at them, so every check sees the real bytes.
        for (size_t i = 0; i < inv.arguments.size(); ++i) {
            const ArgumentDef &def = command.arguments[std::min(i, command.arguments.size() - 1)];
            const std::string given = inv.arguments[i];
            if (!Unescape(given, &inv.arguments[i])) {
                return UsageError(&command, std::string("argument ") + def.name + kNotEscaped);
            }
        }
        for (const OptionDef &option : command.options) {
            std::string *value = IsPath(option) && inv.Has(option.name) ? &inv.options[option.name] : nullptr;
            if (value != nullptr && !Unescape(std::string(*value), value)) {
                return UsageError(&command, std::string("option --") + option.name + kNotEscaped);
            }
        }
    }
    return outcome;
}

}  // namespace

bool IsPath(const OptionDef &option) {
    return option.valueName != nullptr && strcmp(option.valueName, "PATH") == 0;
}

bool TakesPaths(const CommandDef &command) {
    return !command.arguments.empty() || std::any_of(command.options.begin(), command.options.end(), IsPath);
}

ParseOutcome ParseCommandLine(int argc, const char *const *argv) {
    bool json = false;
    int i = 1;
    for (; i < argc && argv[i][0] == '-'; ++i) {
        const std::string arg = argv[i];
        if (IsHelp(arg)) {
            return Help(nullptr);
        }
        if (arg != "--json") {
            return UsageError(nullptr, "unknown option " + arg + " (options follow the command)");
        }
        json = true;
    }
    if (i >= argc) {
        return UsageError(nullptr, "no command given");
    }
    const std::string name = argv[i];
    if (name == "help") {
        if (i + 1 >= argc) {
            return Help(nullptr);
        }
        const CommandDef *topic = FindCommand(argv[i + 1]);
        if (topic == nullptr) {
            return UsageError(nullptr, std::string("unknown command ") + argv[i + 1]);
        }
        if (i + 2 < argc) {
            return UsageError(nullptr, std::string("unexpected argument ") + argv[i + 2]);
        }
        return Help(topic);
    }
    const CommandDef *command = FindCommand(name);
    if (command == nullptr) {
        return UsageError(nullptr, "unknown command " + name);
    }
    return ParseCommandArgs(*command, json, argc, argv, i + 1);
}

}  // namespace norvo::cli
