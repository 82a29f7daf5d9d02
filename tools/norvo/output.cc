#include "output.h"

#include <algorithm>
#include <iostream>

#include "exit_status.h"
#include "help.h"
#include "norvo/errors.h"
#include "text_safe.h"

namespace norvo::cli {
namespace {

Json::Value Utf8Clean(const Json::Value &value) {
    switch (value.type()) {
    case Json::stringValue:
        return Json::Value(ValidUtf8(value.asString()));
    case Json::arrayValue: {
        Json::Value out(Json::arrayValue);
        for (const Json::Value &item : value) {
            out.append(Utf8Clean(item));
        }
        return out;
    }
    case Json::objectValue: {
        Json::Value out(Json::objectValue);
        for (const std::string &key : value.getMemberNames()) {
            out[ValidUtf8(key)] = Utf8Clean(value[key]);
        }
        return out;
    }
    default:
        return value;
    }
}

}  // namespace

TextTable &TextTable::Row(std::string label, std::string value) {
    entries_.push_back({true, std::move(label), std::move(value)});
    return *this;
}

TextTable &TextTable::Line(std::string text) {
    entries_.push_back({false, std::string(), std::move(text)});
    return *this;
}

void TextTable::Print(std::ostream &out) const {
    size_t width = 0;
    for (const Entry &entry : entries_) {
        if (entry.inColumns) {
            width = std::max(width, entry.label.size());
        }
    }
    for (const Entry &entry : entries_) {
        if (entry.inColumns) {
            out << entry.label << std::string(width - entry.label.size() + 2, ' ');
        }
        out << TerminalSafe(entry.value) << '\n';
    }
}

std::string WriteJson(const Json::Value &value) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";  // one line: easy to grep and to split
    // With the strings already valid, this escapes every non-ASCII character: the output is
    // plain ASCII whatever the names hold.
    builder["emitUTF8"] = false;
    return Json::writeString(builder, Utf8Clean(value));
}

Json::Value ErrorJson(int code) {
    Json::Value error(Json::objectValue);
    error["code"] = code;
    error["key"] = NvoParseErrorToOBXString(code, nullptr);
    return error;
}

std::string ErrorText(int code) {
    return "error " + std::to_string(code) + " (" + NvoParseErrorToOBXString(code, nullptr) + ")";
}

int ReportSuccess(const Invocation &inv, const Json::Value &data, const TextTable &text) {
    if (inv.json) {
        Json::Value root(Json::objectValue);
        root["success"] = true;
        root["data"] = data;
        std::cout << WriteJson(root) << '\n';
    } else {
        text.Print(std::cout);
    }
    return kExitOk;
}

int ReportFailure(const Invocation &inv, int code, const std::string &message) {
    if (inv.json) {
        Json::Value root(Json::objectValue);
        root["success"] = false;
        root["error"] = ErrorJson(code);
        if (!message.empty()) {
            root["error"]["message"] = message;
        }
        std::cout << WriteJson(root) << '\n';
    } else {
        std::cerr << ErrorText(code);
        if (!message.empty()) {
            std::cerr << ": " << TerminalSafe(message);
        }
        std::cerr << '\n';
    }
    return kExitFailure;
}

int ReportLibraryFailure(const Invocation &inv, const std::string &message) {
    const int code = NvoLibGetErr();
    if (code == NVO_ERR_NONE) {
        return ReportFailure(inv, NVO_ERR_SYSTEM, message.empty() ? "the library gave no error code" : message);
    }
    return ReportFailure(inv, code, message);
}

int ReportUsageError(const CommandDef *command, const std::string &message) {
    const std::string prefix = command != nullptr ? std::string("norvo ") + command->name : "norvo";
    std::cerr << prefix << ": " << TerminalSafe(message) << '\n';
    if (command != nullptr) {
        PrintUsageLine(std::cerr, *command);
    }
    std::cerr << "Try '" << prefix << " --help' for more.\n";
    return kExitUsage;
}

}  // namespace norvo::cli
