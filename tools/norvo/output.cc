#include "output.h"
#include <time.h>

#include <algorithm>
#include <iostream>
#include <string_view>
#include <utility>
#include <vector>

#include "exit_status.h"
#include "help.h"
#include "json_text.h"
#include "norvo/errors.h"
#include "text_safe.h"

namespace norvo::cli {
namespace {

constexpr char kEscapedSuffix[] = "_escaped";

}  // namespace

void MakeJsonSafe(Json::Value &value) {
    if (value.isArray()) {
        for (Json::Value &item : value) {
            if (item.isString() && !IsValidUtf8(item.asString())) {
                item = ValidUtf8(item.asString());
            } else if (!item.isString()) {
                MakeJsonSafe(item);
            }
        }
        return;
    }
    if (!value.isObject()) {
        return;
    }
    std::vector<std::pair<std::string, std::string>> siblings;  // added after the walk
    for (auto member = value.begin(); member != value.end(); ++member) {
        if (!member->isString()) {
            MakeJsonSafe(*member);
            continue;
        }
        const char *begin = nullptr;
        const char *end = nullptr;
        member->getString(&begin, &end);
        const std::string_view text(begin, static_cast<size_t>(end - begin));
        if (!IsValidUtf8(text)) {
            siblings.emplace_back(member.name() + kEscapedSuffix, TerminalSafe(text));
            *member = ValidUtf8(text);  // last: text points into the member
        }
    }
    for (auto &[key, form] : siblings) {
        value[key] = std::move(form);
    }
}

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
    Json::Value safe = value;
    MakeJsonSafe(safe);
    std::string text;
    AppendJson(text, safe);
    return text;
}

JsonPageWriter::JsonPageWriter(std::ostream &out, Json::UInt64 total, int offset) : out_(out) {
    // The frame is written around an empty list, so the page comes out in exactly the bytes
    // of the whole tree written at once.
    Json::Value root(Json::objectValue);
    root["success"] = true;
    root["data"]["total"] = total;
    root["data"]["offset"] = offset;
    root["data"]["files"] = Json::Value(Json::arrayValue);
    const std::string frame = WriteJson(root);
    static constexpr char kList[] = "\"files\":[]";
    const size_t split = frame.find(kList) + sizeof kList - 2;
    out_ << frame.substr(0, split);
    tail_ = frame.substr(split);
}

void JsonPageWriter::Entry(Json::Value &entry) {
    MakeJsonSafe(entry);
    text_.clear();
    if (!first_) {
        text_ += ',';
    }
    first_ = false;
    AppendJson(text_, entry);
    out_.write(text_.data(), static_cast<std::streamsize>(text_.size()));
}

void JsonPageWriter::Finish() {
    out_ << tail_ << '\n';
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
        return ReportFailure(inv, NVO_ERR_SYSTEM,
                             message.empty() ? "the library gave no error code" : message);
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

std::string Date(int32_t seconds) {
    const time_t when = seconds;
    struct tm parts;
    char buf[32];
    if (localtime_r(&when, &parts) == nullptr || strftime(buf, sizeof buf, "%Y-%m-%d %H:%M", &parts) == 0) {
        return "?";
    }
    return buf;
}

}  // namespace norvo::cli
