// ls: the page of a directory (or of the share list at "/") that the web interface receives.
#include <time.h>

#include <algorithm>
#include <iostream>
#include <list>
#include <memory>
#include <string>
#include <vector>

#include "accounts.h"
#include "common/path_names.h"
#include "exit_status.h"
#include "handlers.h"
#include "identity.h"
#include "listable.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvoenum.h"
#include "norvo/norvomisc.h"
#include "norvo/norvosearch.h"
#include "number.h"
#include "output.h"
#include "text_safe.h"

namespace norvo::cli {
namespace {

using FileSearch::FindComp;
using FileSearch::FindFactory;

constexpr int kLargestPageNumber = 0x7fffffff;  // the library reads the offset as signed 32-bit
constexpr int kDirInfo = NVO_INFO_REAL_PATH | NVO_INFO_SIZE | NVO_INFO_OWNER | NVO_INFO_TIME | NVO_INFO_PERM |
                         NVO_INFO_TYPE | NVO_INFO_MOUNT_POINT_TYPE;
constexpr int kShareInfo = kDirInfo | NVO_INFO_VOLUME_STATUS;

struct InfoName {
    const char *name;
    int flag;
};
constexpr InfoName kInfoNames[] = {
    {"real_path", NVO_INFO_REAL_PATH},
    {"size", NVO_INFO_SIZE},
    {"owner", NVO_INFO_OWNER},
    {"time", NVO_INFO_TIME},
    {"perm", NVO_INFO_PERM},
    {"type", NVO_INFO_TYPE},
    {"mount_point_type", NVO_INFO_MOUNT_POINT_TYPE},
    {"volume_status", NVO_INFO_VOLUME_STATUS},
    {"sync_share", NVO_INFO_SYNC_SHARE},
};

// The name condition the request's --name makes; deletes what the factory appended (a name
// condition frees the alternatives joined to it).
struct Conditions {
    std::vector<FindComp *> items;
    Conditions() = default;
    Conditions(const Conditions &) = delete;
    Conditions &operator=(const Conditions &) = delete;
    ~Conditions() {
        for (FindComp *item : items) {
            delete item;
        }
    }
};

// The comma-separated info names as flags; false with *bad set to the first unknown name.
bool ParseInfo(const std::string &text, int *info, std::string *bad) {
    *info = 0;
    size_t start = 0;
    while (start <= text.size()) {
        size_t end = text.find(',', start);
        if (end == std::string::npos) {
            end = text.size();
        }
        const std::string word = text.substr(start, end - start);
        int flag = 0;
        for (const InfoName &known : kInfoNames) {
            if (word == known.name) {
                flag = known.flag;
            }
        }
        if (flag == 0) {
            *bad = word;
            return false;
        }
        *info |= flag;
        start = end + 1;
    }
    return true;
}

// Columns in characters, not bytes: a UTF-8 owner name counts once per character.
size_t Width(const std::string &text) {
    size_t width = 0;
    for (const char c : text) {
        width += (static_cast<unsigned char>(c) & 0xC0) != 0x80 ? 1 : 0;
    }
    return width;
}

std::string HumanSize(uint64_t size) {
    char buf[64];
    if (FileUnitGet(static_cast<long long>(size), buf, sizeof buf, true) != 1) {
        return "0 Bytes";  // the library writes nothing for 0
    }
    return buf;
}

// The cells of one line, escaped for the terminal; the name last (it may be long or odd).
class Table {
public:
    Table(int info, bool shares) : info_(info), volume_(shares && (info & NVO_INFO_VOLUME_STATUS)) {}

    std::vector<std::string> Header() const {
        std::vector<std::string> cells;
        if (info_ & NVO_INFO_PERM)
            cells.push_back("posix");
        if (info_ & NVO_INFO_OWNER)
            cells.push_back("owner");
        if (info_ & NVO_INFO_SIZE)
            cells.push_back("size");
        if (info_ & NVO_INFO_TIME)
            cells.push_back("modified");
        if (volume_)
            cells.push_back("volume");
        cells.push_back("name");
        return cells;
    }

    std::vector<std::string> Cells(const DIRENTRY_INFO &entry) const {
        std::vector<std::string> cells;
        if (info_ & NVO_INFO_PERM)
            cells.push_back(GetPrivilegeStr(entry.mode));
        if (info_ & NVO_INFO_OWNER) {
            cells.push_back(TerminalSafe(entry.user.empty() ? std::to_string(entry.uid) : entry.user));
        }
        if (info_ & NVO_INFO_SIZE)
            cells.push_back(entry.isdir ? "-" : HumanSize(entry.size));
        if (info_ & NVO_INFO_TIME)
            cells.push_back(Date(entry.mtime));
        if (volume_) {
            cells.push_back(entry.mount_point_type == "remotefail"
                                ? std::string("unreachable")
                                : std::string(entry.readonly ? "read-only" : "read-write") + ", " +
                                      HumanSize(entry.freespace) + " free");
        }
        cells.push_back(TerminalSafe(entry.name) + (entry.isdir ? "/" : ""));
        return cells;
    }

    // The size column reads best aligned right.
    bool RightAligned(size_t column) const { return Header()[column] == "size"; }

private:
    int info_;
    bool volume_;
};

// Aligned lines, printed as they are made: the widths come from a first pass over the
// entries, so the table costs no memory per entry.
void PrintTable(std::ostream &out, const std::list<DIRENTRY_INFO> &files, int info, bool shares) {
    const Table table(info, shares);
    const std::vector<std::string> header = table.Header();
    std::vector<size_t> widths(header.size(), 0);
    const auto measure = [&](const std::vector<std::string> &cells) {
        for (size_t i = 0; i + 1 < cells.size(); ++i) {
            widths[i] = std::max(widths[i], Width(cells[i]));
        }
    };
    std::vector<bool> right(header.size());
    for (size_t i = 0; i < header.size(); ++i) {
        right[i] = table.RightAligned(i);
    }
    const auto print = [&](const std::vector<std::string> &cells) {
        for (size_t i = 0; i + 1 < cells.size(); ++i) {
            const std::string pad(widths[i] - Width(cells[i]), ' ');
            out << (right[i] ? pad + cells[i] : cells[i] + pad) << "  ";
        }
        out << cells.back() << '\n';
    };
    measure(header);
    for (const DIRENTRY_INFO &entry : files) {
        measure(table.Cells(entry));
    }
    print(header);
    for (const DIRENTRY_INFO &entry : files) {
        print(table.Cells(entry));
    }
}

std::string PageText(unsigned long total, unsigned long offset, size_t shown) {
    std::string text = "total " + std::to_string(total);
    if (shown == 0) {
        return text + (total == 0 ? "" : ", nothing from offset " + std::to_string(offset));
    }
    if (shown == total) {
        return text;
    }
    return text + ", showing " + std::to_string(offset + 1) + "-" + std::to_string(offset + shown);
}

}  // namespace

int RunLs(const Invocation &inv) {
    const std::string &userName = *inv.Value("user");
    std::string path = inv.arguments[0];
    while (path.size() > 1 && path.back() == '/') {
        path.pop_back();  // "/photo/" lists /photo; only "/" itself is the share list
    }
    const bool shares = path == "/";
    if (HasDotComponent(path)) {
        // The library refuses it too; the command says why in words.
        return ReportUsageError(inv.command, "PATH may not hold . or .. components: " + path);
    }

    // The command line first: nothing is asked of the system for a wrong one.
    int info = shares ? kShareInfo : kDirInfo;
    if (const std::string *text = inv.Value("info")) {
        std::string bad;
        if (!ParseInfo(*text, &info, &bad)) {
            return ReportUsageError(inv.command, "--info does not know \"" + bad +
                                                     "\"; names: real_path, size, owner, time, perm, type, "
                                                     "mount_point_type, volume_status, sync_share");
        }
    }
    int offset = 0;
    int limit = 0;
    if (const std::string *text = inv.Value("offset");
        text && !ParseNumber(*text, 0, kLargestPageNumber, &offset)) {
        return ReportUsageError(inv.command, "--offset wants a number from 0 to 2147483647, not " + *text);
    }
    if (const std::string *text = inv.Value("limit");
        text && !ParseNumber(*text, 0, kLargestPageNumber, &limit)) {
        return ReportUsageError(inv.command, "--limit wants a number from 0 to 2147483647, not " + *text);
    }
    _tag_dir_entry_type_ type = DIR_ENTRY_TYPE_ALL;
    if (const std::string *word = inv.Value("type")) {
        if (*word == "dir") {
            type = DIR_ENTRY_TYPE_DIR;
        } else if (*word == "file") {
            type = DIR_ENTRY_TYPE_FILE;
        } else if (*word != "all") {
            return ReportUsageError(inv.command, "--type wants dir, file or all, not " + *word);
        }
    }
    if (shares && (inv.Has("type") || inv.Has("name"))) {
        return ReportUsageError(inv.command, "--type and --name filter a directory, not the share list at /");
    }
    const char *sortKey = inv.CStr("sort");
    const bool ascending = !inv.Has("desc");

    int status = kExitFailure;
    UserRecord user = RequireUser(inv, userName, &status);
    if (!user) {
        return status;
    }
    Conditions conditions;
    if (const std::string *terms = inv.Value("name")) {
        NvoLibSetErr(NVO_ERR_NONE);
        if (!FindFactory::createFindOp(FindFactory::FIND_FIELD_NAME, "", terms->c_str(), conditions.items)) {
            return ReportLibraryFailure(inv, "the --name condition");
        }
    }
    std::string realPath;
    if (!shares && (realPath = ListableRealPath(inv, userName, path, &status)).empty()) {
        return status;
    }

    // As the user from here on: modes and ACL masks are judged for the user's identity.
    std::string error;
    std::unique_ptr<UserIdentity> identity = UserIdentity::Assume(*user, &error);
    if (!identity) {
        return ReportFailure(inv, NVO_ERR_SYSTEM, error);
    }
    NvoEnum lister;
    std::list<DIRENTRY_INFO> files;
    unsigned long total = 0;
    NvoLibSetErr(NVO_ERR_NONE);
    const int listed =
        shares ? lister.NvoLibShareEntryListEnum(userName.c_str(), nullptr, false, sortKey, info,
                                                 static_cast<unsigned long>(offset),
                                                 static_cast<unsigned long>(limit), ascending, files, &total)
               : lister.NvoLibDirEntryListEnum(
                     path.c_str(), realPath.c_str(), sortKey, info, static_cast<unsigned long>(offset),
                     static_cast<unsigned long>(limit), ascending, type, conditions.items, files, &total);
    identity.reset();
    if (listed != 1) {
        return ReportLibraryFailure(inv, "listing " + path);
    }
    if (limit != 0 && static_cast<unsigned long>(offset) >= total) {
        files.clear();  // a page past the end is empty (the library leaves that case open)
    }

    if (inv.json) {
        JsonPageWriter page(std::cout, total, offset);
        for (const DIRENTRY_INFO &entry : files) {
            Json::Value item(Json::objectValue);
            DumpFileInfo(info, entry, item);
            page.Entry(item);
        }
        page.Finish();
    } else {
        std::cout << PageText(total, static_cast<unsigned long>(offset), files.size()) << '\n';
        if (!files.empty()) {
            PrintTable(std::cout, files, info, shares);
        }
    }
    return kExitOk;
}

}  // namespace norvo::cli
