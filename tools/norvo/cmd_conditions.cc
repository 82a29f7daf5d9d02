// conditions: the search conditions a request's fields make, their file-index records, and
// which files they let through.
#include <errno.h>
#include <string.h>

#include <memory>
#include <string>
#include <vector>

#include "condition_records.h"
#include "exit_status.h"
#include "handlers.h"
#include "norvo/errors.h"
#include "norvo/norvosearch.h"
#include "output.h"
#include "quib_stat.h"

namespace norvo::cli {
namespace {

using FileSearch::FindComp;
using FileSearch::FindFactory;

// Deletes every condition the factory appended (a name condition frees its alternatives).
struct ConditionList {
    std::vector<FindComp *> items;
    ConditionList() = default;
    ConditionList(const ConditionList &) = delete;
    ConditionList &operator=(const ConditionList &) = delete;
    ~ConditionList() {
        for (FindComp *item : items) {
            delete item;
        }
    }
};

// One option and the request field it feeds; "op:value" options carry the operator word.
struct FieldOption {
    const char *option;
    FindFactory::_tag_FIND_FIELD_ field;
    enum { kValue, kOpWord, kOpAndValue } form;
};

// In the order of the field codes, as a request handler would meet them.
constexpr FieldOption kFields[] = {
    {"name", FindFactory::FIND_FIELD_NAME, FieldOption::kValue},
    {"type", FindFactory::FIND_FIELD_TYPE, FieldOption::kOpWord},
    {"ext", FindFactory::FIND_FIELD_EXT, FieldOption::kValue},
    {"user", FindFactory::FIND_FIELD_USER, FieldOption::kValue},
    {"group", FindFactory::FIND_FIELD_GROUP, FieldOption::kValue},
    {"mtime", FindFactory::FIND_FIELD_MTIME, FieldOption::kOpAndValue},
    {"crtime", FindFactory::FIND_FIELD_CRTIME, FieldOption::kOpAndValue},
    {"atime", FindFactory::FIND_FIELD_ATIME, FieldOption::kOpAndValue},
    {"size", FindFactory::FIND_FIELD_SIZE, FieldOption::kOpAndValue},
};

struct Built {
    FindComp *condition;
    const char *option;
    std::vector<int> records;
};

Json::Value NumberOrNull(int number) {
    return number != 0 ? Json::Value(number) : Json::Value();
}

std::string Links(const RecordNumbers &numbers, const __tag_FI_SQL_COND &record) {
    std::string text;
    if (const int orNumber = numbers.Of(record.orNext)) {
        text += "  or #" + std::to_string(orNumber);
    }
    if (const int andNumber = numbers.Of(record.andNext)) {
        text += "  and #" + std::to_string(andNumber);
    }
    return text;
}

std::string RecordList(const std::vector<int> &records) {
    std::string text;
    for (const int number : records) {
        text += (text.empty() ? "#" : ", #") + std::to_string(number);
    }
    return text.empty() ? "(no record)" : text;
}

// What the walker would decide for path: the number of the first condition that fails, 0 when
// all hold, -1 when the file can't be read (*err set).
int FirstFailing(const std::vector<Built> &built, const std::string &path, int *err) {
    QUIBSTAT st{};
    if (VLIBCFileLStat(path.c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st) != 0) {
        *err = errno;
        return -1;
    }
    for (size_t i = 0; i < built.size(); ++i) {
        if (!(*built[i].condition)(path.c_str(), st)) {
            return static_cast<int>(i) + 1;
        }
    }
    return 0;
}

}  // namespace

int RunConditions(const Invocation &inv) {
    ConditionList list;
    std::vector<Built> built;
    for (const FieldOption &field : kFields) {
        const std::string *given = inv.Value(field.option);
        if (given == nullptr) {
            continue;
        }
        std::string op;
        std::string value = *given;
        if (field.form == FieldOption::kOpWord) {
            op = *given;
        } else if (field.form == FieldOption::kOpAndValue) {
            const size_t colon = given->find(':');
            if (colon == std::string::npos) {
                const bool size = field.field == FindFactory::FIND_FIELD_SIZE;
                return ReportUsageError(inv.command, std::string("option --") + field.option + " takes " +
                                                         (size ? "OP:BYTES, e.g. equal:100"
                                                               : "OP:SECONDS, e.g. before:1700000000"));
            }
            op = given->substr(0, colon);
            value = given->substr(colon + 1);
        }
        const size_t before = list.items.size();
        NvoLibSetErr(NVO_ERR_NONE);
        if (!FindFactory::createFindOp(field.field, op.c_str(), value.c_str(), list.items)) {
            return ReportLibraryFailure(inv, std::string("the --") + field.option + " condition");
        }
        for (size_t i = before; i < list.items.size(); ++i) {
            built.push_back({list.items[i], field.option, {}});
        }
    }

    // Numbered before joining, so each condition lists only its own records.
    RecordNumbers numbers;
    for (Built &b : built) {
        b.records = numbers.Add(*b.condition);
    }
    for (size_t i = 1; i < built.size(); ++i) {
        (*built[i - 1].condition)(built[i].condition);
    }

    Json::Value data(Json::objectValue);
    TextTable text;
    data["conditions"] = Json::Value(Json::arrayValue);
    text.Line(built.empty() ? "conditions: none (every file matches)" : "conditions (every one must hold):");
    for (size_t i = 0; i < built.size(); ++i) {
        const char *kind = ConditionKind(*built[i].condition);
        Json::Value entry(Json::objectValue);
        entry["number"] = static_cast<int>(i) + 1;
        entry["kind"] = kind;
        entry["from"] = std::string("--") + built[i].option;
        entry["records"] = Json::Value(Json::arrayValue);
        for (const int number : built[i].records) {
            entry["records"].append(number);
        }
        data["conditions"].append(entry);
        text.Row("  " + std::to_string(i + 1) + " " + kind,
                 "records " + RecordList(built[i].records) + "  (from --" + built[i].option + ")");
    }

    data["first"] = NumberOrNull(built.empty() ? 0 : numbers.Of(built.front().condition->getFirstCond()));
    data["records"] = Json::Value(Json::arrayValue);
    if (!numbers.Records().empty()) {
        text.Line("records (the file index's query, from #1):");
    }
    int number = 0;
    for (const __tag_FI_SQL_COND *record : numbers.Records()) {
        ++number;
        Json::Value entry(Json::objectValue);
        entry["number"] = number;
        entry["type"] = static_cast<unsigned int>(record->type);
        entry["type_name"] = CondTypeName(record->type);
        entry["op"] = static_cast<unsigned int>(record->op);
        entry["op_name"] = CondOpName(record->op);
        entry["value"] = record->value;
        entry["and"] = NumberOrNull(numbers.Of(record->andNext));
        entry["or"] = NumberOrNull(numbers.Of(record->orNext));
        data["records"].append(entry);
        text.Row("  #" + std::to_string(number), CondTypeName(record->type) + " " + CondOpName(record->op) +
                                                     " \"" + record->value + "\"" + Links(numbers, *record));
    }

    data["files"] = Json::Value(Json::arrayValue);
    for (const std::string &path : inv.arguments) {
        int err = 0;
        const int failing = FirstFailing(built, path, &err);
        Json::Value entry(Json::objectValue);
        entry["path"] = path;
        if (failing < 0) {
            entry["error"] = strerror(err);
            text.Row(path, std::string("cannot read its status: ") + strerror(err));
        } else {
            entry["match"] = failing == 0;
            entry["failed_condition"] = NumberOrNull(failing);
            text.Row(path, failing == 0 ? "matches"
                                        : "no match: condition " + std::to_string(failing) + " (" +
                                              ConditionKind(*built[failing - 1].condition) + ")");
        }
        data["files"].append(entry);
    }
    return ReportSuccess(inv, data, text);
}

}  // namespace norvo::cli
