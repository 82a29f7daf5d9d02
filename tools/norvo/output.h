// Printing results: aligned text or one JSON object, and the three kinds of ending (success,
// failure with the library's code and key, usage error).
#pragma once
#include <json/json.h>

#include <ostream>
#include <string>
#include <utility>
#include <vector>

#include "command.h"

namespace norvo::cli {

// "label  value" lines whose values start in one column; every cell is made terminal-safe
// when printed.
class TextTable {
public:
    TextTable &Row(std::string label, std::string value);
    // A line of its own, outside the columns.
    TextTable &Line(std::string text);
    void Print(std::ostream &out) const;

private:
    struct Entry {
        bool inColumns;
        std::string label;
        std::string value;
    };
    std::vector<Entry> entries_;
};

// A library code and its message key, for JSON and text.
Json::Value ErrorJson(int code);
std::string ErrorText(int code);  // "error 408 (error:error_no_path)"

// {"success":true,"data":data} or the text; returns kExitOk.
int ReportSuccess(const Invocation &inv, const Json::Value &data, const TextTable &text);
// The failure of code with its message key; message, when given, says what was being done.
// Returns kExitFailure.
int ReportFailure(const Invocation &inv, int code, const std::string &message = std::string());
// As above with the library's error slot, read right after the failed call. A slot still at 0
// (the call failed without saying why) is reported as 401, the system failure.
int ReportLibraryFailure(const Invocation &inv, const std::string &message = std::string());
// The message and the usage line on stderr, in text whatever --json says; returns kExitUsage.
int ReportUsageError(const CommandDef *command, const std::string &message);

// The JSON text of value with every string made valid UTF-8, written as ASCII.
std::string WriteJson(const Json::Value &value);

}  // namespace norvo::cli
