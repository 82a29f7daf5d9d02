// Printing results: aligned text or one JSON object, and the three kinds of ending (success,
// failure with the library's code and key, usage error).
#pragma once
#include <stdint.h>

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

// A modification time as a listing shows it, local time ("2024-05-01 13:45"; "?" if unprintable).
std::string Date(int32_t seconds);

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

// The JSON text of value, one line of plain ASCII (AppendJson), made safe by MakeJsonSafe.
std::string WriteJson(const Json::Value &value);

// Makes every string of value valid UTF-8 (malformed bytes become U+FFFD) and gives each
// object member whose string was not valid UTF-8 a sibling "<key>_escaped" holding the exact
// bytes in the escaped form (TerminalSafe), which the --escaped option of the subcommands
// takes back. Strings inside arrays get no such sibling.
void MakeJsonSafe(Json::Value &value);

// Writes the answer {"success":true,"data":{"total":N,"offset":N,"files":[...]}} entry by
// entry, in the same bytes as WriteJson of the whole tree: a long listing needs no tree.
class JsonPageWriter {
public:
    JsonPageWriter(std::ostream &out, Json::UInt64 total, int offset);
    JsonPageWriter(const JsonPageWriter &) = delete;
    JsonPageWriter &operator=(const JsonPageWriter &) = delete;
    // Writes entry (made safe in place) as the next element of "files".
    void Entry(Json::Value &entry);
    // Closes the list and the object and ends the line.
    void Finish();

private:
    std::ostream &out_;
    std::string tail_;
    std::string text_;  // one entry's text, kept for its capacity
    bool first_ = true;
};

}  // namespace norvo::cli
