#include "norvosearch/search_db_record.h"

#include <ctype.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>

#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "quib_fs.h"

namespace norvo::search {

SplitResult SplitRealPath(const std::string &path, std::string *root, std::string *rest) {
    const size_t share = path.find('/', 1);
    if (path.empty() || share == std::string::npos) {
        return SplitResult::kNoShare;
    }
    const size_t below = path.find('/', share + 1);
    if (below == std::string::npos) {
        return SplitResult::kNoPath;
    }
    *root = path.substr(0, below);
    *rest = path.substr(below + 1);
    return SplitResult::kOk;
}

std::string KeyShare(const std::string &share) {
    return IsDirUserHome(share, nullptr) == 1 ? std::string("homes") : share;
}

std::string TypeText(const char *name, bool isDir) {
    const char *dot = strrchr(name, '.');
    if (isDir || dot == nullptr || dot == name) {
        return std::string();
    }
    std::string ext(dot + 1);
    for (char &c : ext) {
        c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
    }
    return ext;
}

void FillHit(const std::string &share, const std::string &root, const std::string &rest,
             const _tag_QUIBSTAT_ &st, FI_FILE_INFO_DATA *r) {
    const size_t slash = rest.rfind('/');
    const std::string name = slash == std::string::npos ? rest : rest.substr(slash + 1);
    const bool isDir = S_ISDIR(st.st_mode);
    snprintf(r->name, sizeof r->name, "%s", name.c_str());
    snprintf(r->realPath, sizeof r->realPath, "%s", root.c_str());
    snprintf(r->parentPath, sizeof r->parentPath, "%s",
             slash == std::string::npos ? "" : rest.substr(0, slash).c_str());
    snprintf(r->share, sizeof r->share, "%s", share.c_str());
    snprintf(r->path, sizeof r->path, "%s", rest.c_str());
    snprintf(r->type, sizeof r->type, "%s", TypeText(name.c_str(), isDir).c_str());
    r->isDir = isDir ? 1 : 0;
    r->size = isDir ? 0 : st.st_size;
    r->crtime = st.st_crtim.tv_sec;
    r->ctime = st.st_ctim.tv_sec;
    r->atime = st.st_atim.tv_sec;
    r->mtime = st.st_mtim.tv_sec;
    snprintf(r->posix, 10, "%s", GetPrivilegeStr(st.st_mode).c_str());
    r->mode = st.st_mode;
    r->uid = st.st_uid;
    r->gid = st.st_gid;
}

bool IsVolume(const char *volume) {
    VOLUME_INFO info{};
    return volume != nullptr && VolumePathParse(volume, &info) == 1 && strcmp(info.szVolumePath, volume) == 0;
}

bool IsTaskId(const char *taskId) {
    if (taskId == nullptr) {
        return false;
    }
    const size_t length = strlen(taskId);
    if (length < 2 || length > 16 || taskId[0] == '0') {
        return false;
    }
    return strspn(taskId, "0123456789ABCDEF") == length;
}

bool IsUserComponent(const char *user) {
    if (user == nullptr || user[0] == '\0' || strcmp(user, ".") == 0 || strcmp(user, "..") == 0) {
        return false;
    }
    size_t length = 0;
    for (; user[length] != '\0'; ++length) {
        const unsigned char c = static_cast<unsigned char>(user[length]);
        if (c == '/' || c < 0x20 || c == 0x7F) {
            return false;
        }
    }
    return length < 256;
}

}  // namespace norvo::search
