// subdirs: the sub-folders of a real directory, as the folder tree of the web interface gets them.
#include <time.h>

#include <algorithm>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include "accounts.h"
#include "exit_status.h"
#include "handlers.h"
#include "identity.h"
#include "norvo/errors.h"
#include "norvo/norvoenum.h"
#include "norvo/norvomisc.h"
#include "norvo/subdirs.h"
#include "output.h"
#include "text_safe.h"

namespace norvo::cli {
namespace {

Json::Value FolderJson(const _tag_SUBDIR_ENTRY_INFO_ &folder) {
    Json::Value item(Json::objectValue);
    item["name"] = folder.name;
    item["path"] = folder.path;
    item["size"] = Json::UInt64(folder.size);
    item["mode"] = folder.mode;
    item["mtime"] = folder.mtime;
    item["uid"] = folder.uid;
    item["gid"] = folder.gid;
    item["is_mount_point"] = folder.isMountPoint;
    item["mount_type"] = folder.mountType;
    return item;
}

std::string MountCell(const _tag_SUBDIR_ENTRY_INFO_ &folder) {
    return folder.isMountPoint ? TerminalSafe(folder.mountType) : "-";
}

// posix, owner, modified, mount and name columns; an unreachable mount has no facts to show.
std::vector<std::string> Cells(const _tag_SUBDIR_ENTRY_INFO_ &folder, NorvoUserEnum &names) {
    const bool unreachable = folder.mountType == "remotefail";
    const std::string owner = names.GetUserNameByUID(folder.uid);
    return {unreachable ? "?" : GetPrivilegeStr(folder.mode),
            unreachable ? "?" : TerminalSafe(owner.empty() ? std::to_string(folder.uid) : owner),
            unreachable ? "?" : Date(folder.mtime), unreachable ? "unreachable" : MountCell(folder),
            TerminalSafe(folder.name) + "/"};
}

// Columns in characters, not bytes: a UTF-8 owner name counts once per character.
size_t Width(const std::string &text) {
    return static_cast<size_t>(std::count_if(
        text.begin(), text.end(), [](char c) { return (static_cast<unsigned char>(c) & 0xC0) != 0x80; }));
}

void PrintTable(const std::vector<_tag_SUBDIR_ENTRY_INFO_> &folders) {
    NorvoUserEnum names;
    std::vector<std::vector<std::string>> rows = {{"posix", "owner", "modified", "mount", "name"}};
    for (const _tag_SUBDIR_ENTRY_INFO_ &folder : folders) {
        rows.push_back(Cells(folder, names));
    }
    std::vector<size_t> widths(rows[0].size(), 0);
    for (const auto &row : rows) {
        for (size_t i = 0; i + 1 < row.size(); ++i) {
            widths[i] = std::max(widths[i], Width(row[i]));
        }
    }
    for (const auto &row : rows) {
        for (size_t i = 0; i + 1 < row.size(); ++i) {
            std::cout << row[i] << std::string(widths[i] - Width(row[i]), ' ') << "  ";
        }
        std::cout << row.back() << '\n';
    }
}

}  // namespace

int RunSubdirs(const Invocation &inv) {
    const std::string &userName = *inv.Value("user");
    const std::string &path = inv.arguments[0];
    int status = kExitFailure;
    // As the user: the folder must be one the user may enter and read.
    std::unique_ptr<UserIdentity> identity = ActAsUser(inv, userName, NVO_ERR_SYSTEM, &status);
    if (!identity) {
        return status;
    }
    std::vector<_tag_SUBDIR_ENTRY_INFO_> folders;
    const int listed = NvoLibEnumSubDir(path, folders);
    identity.reset();
    if (listed != 1) {
        return ReportLibraryFailure(inv, "listing the folders of " + path);
    }
    if (inv.json) {
        Json::Value data(Json::objectValue);
        data["total"] = Json::UInt64(folders.size());
        data["folders"] = Json::Value(Json::arrayValue);
        for (const _tag_SUBDIR_ENTRY_INFO_ &folder : folders) {
            data["folders"].append(FolderJson(folder));
        }
        return ReportSuccess(inv, data, TextTable());
    }
    std::cout << "total " << folders.size() << '\n';
    if (!folders.empty()) {
        PrintTable(folders);
    }
    return kExitOk;
}

}  // namespace norvo::cli
