// The hit record of a task's database, and the checks that stand between a request's values
// and a path.
#pragma once
#include <string.h>

#include <string>

#include "fileidx.h"
#include "quib_stat.h"

namespace norvo::search {

// "/volume1/photo/2013/a.jpg" split after its two leading components: root "/volume1/photo",
// rest "2013/a.jpg".
enum class SplitResult { kOk, kNoShare, kNoPath };
SplitResult SplitRealPath(const std::string &path, std::string *root, std::string *rest);

// "homes" for a name IsDirUserHome takes for the user's home, else share.
std::string KeyShare(const std::string &share);

// Copies text into field, as snprintf(field, size, "%s") would.
void CopyText(char *field, size_t size, const char *text, size_t length);
inline void CopyText(char *field, size_t size, const std::string &text) {
    CopyText(field, size, text.c_str(), strlen(text.c_str()));
}

// Fills *r for the entry at rest below the share folder root (share: the key's share name).
// Directories are stored with size 0, as the in-memory size test counts them.
void FillHit(const std::string &share, const std::string &root, const std::string &rest,
             const _tag_QUIBSTAT_ &st, FI_FILE_INFO_DATA *r);

// What sorting by "type" orders by: the lower-case extension of a file ("" for folders and
// names without one).
std::string TypeText(const char *name, bool isDir);

// A volume's own folder: what VolumePathParse names as the volume, and nothing more.
bool IsVolume(const char *volume);
// What getUniqueID makes: 2 to 16 upper-case hexadecimal digits, the first not 0.
bool IsTaskId(const char *taskId);
// One path component: not empty, ".", "..", and without "/" or a control character.
bool IsUserComponent(const char *user);

}  // namespace norvo::search
