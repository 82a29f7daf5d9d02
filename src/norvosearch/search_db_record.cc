#include "norvosearch/search_db_record.h"

#include <ctype.h>
#include <string.h>
#include <sys/stat.h>

#include <algorithm>

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

void CopyText(char *field, size_t size, const char *text, size_t length) {
    length = std::min(length, size - 1);
    memcpy(field, text, length);
    field[length] = '\0';
}

void FillHit(const std::string &share, const std::string &root, const std::string &rest,
             const _tag_QUIBSTAT_ &st, FI_FILE_INFO_DATA *r) {
    // Copies, not snprintf: a hit of a walk is stored for every match.
    const size_t slash = rest.rfind('/');
    const size_t nameAt = slash == std::string::npos ? 0 : slash + 1;
    const bool isDir = S_ISDIR(st.st_mode);
    CopyText(r->name, sizeof r->name, rest.c_str() + nameAt, strlen(rest.c_str() + nameAt));
    CopyText(r->realPath, sizeof r->realPath, root);
    CopyText(r->parentPath, sizeof r->parentPath, rest.c_str(), slash == std::string::npos ? 0 : slash);
    CopyText(r->share, sizeof r->share, share);
    CopyText(r->path, sizeof r->path, rest);
    CopyText(r->type, sizeof r->type, TypeText(rest.c_str() + nameAt, isDir));
    r->isDir = isDir ? 1 : 0;
    r->size = isDir ? 0 : st.st_size;
    r->crtime = st.st_crtim.tv_sec;
    r->ctime = st.st_ctim.tv_sec;
    r->atime = st.st_atim.tv_sec;
    r->mtime = st.st_mtim.tv_sec;
    CopyText(r->posix, 10, GetPrivilegeStr(st.st_mode));
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
