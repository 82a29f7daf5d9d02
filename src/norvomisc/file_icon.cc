// The icon file shown beside a listed entry.
#include <string.h>
#include <sys/stat.h>
#include <syslog.h>

#include <string>
#include <vector>

#include "common/owners.h"
#include "errors/guard.h"
#include "norvo/norvomisc.h"
#include "quib_fs.h"
#include "quib_webutils.h"

namespace {

// Relative to the working directory of the CGI programs.
constexpr char kIconDir[] = "../images/files_ext";

std::string FileIcon(const char *name) {
    const char *ext = ReturnFileExt(name, 0);
    // A listed name never holds "/"; a crafted one must not probe files outside the icon folder.
    if (ext == nullptr || strchr(ext, '/') != nullptr) {
        return "misc.png";
    }
    const norvo::CString lower(strdup(ext));
    if (NvoLibStringToLower(lower.get()) != 0) {
        // Only a failed copy gets here. The message is kept as it is known: led by the line
        // alone, without the module's name (intended).
        syslog(LOG_ERR, "(%d): failed to transfer %s to lowercase.", __LINE__, ext);
        return "misc.png";
    }
    std::string icon = std::string(lower.get()) + ".png";
    struct stat st;
    if (stat((std::string(kIconDir) + "/" + icon).c_str(), &st) != 0) {
        return "misc.png";
    }
    return icon;
}

// Only the recycle bin at the top of a share: its path within the share has one component.
bool IsShareRecycleBin(const std::string &sharePath) {
    if (sharePath.empty()) {
        return false;
    }
    std::vector<std::string> components;
    StringExplode(components, sharePath, "/");
    return components.size() == 1 && components.front() == "#recycle";
}

std::string FolderIcon(const std::string &realPath, const std::string &sharePath) {
    if (WebUtils::IsMountPoint(realPath)) {
        const int type = QUIBGetFSType(realPath.c_str(), 0);
        if (QUIBFSIsImageFS(type)) {
            return "isomountpoint.png";
        }
        if (QUIBFSIsRemoteFS(type)) {
            return "remotemountpoint.png";
        }
        return "folder.png";
    }
    return IsShareRecycleBin(sharePath) ? "recycle_bin.png" : "folder.png";
}

}  // namespace

void GetImgFileExt(const char *name, bool isDir, std::string &out, const std::string &realPath,
                   const std::string &sharePath) {
    norvo::GuardedVoid([&] {
        out = "misc.png";
        if (name == nullptr) {
            return;
        }
        out = isDir ? FolderIcon(realPath, sharePath) : FileIcon(name);
    });
}
