// The sub-folders of one real directory, for the folder tree of the web interface.
#pragma once
#include <stdint.h>

#include <string>
#include <vector>

#include "norvo/export.h"

// One sub-folder.
struct _tag_SUBDIR_ENTRY_INFO_ {
    std::string name;
    std::string path;  // the listed directory's path, "/", the name
    uint64_t size = 0;
    uint32_t mode = 0;  // the stat mode word
    int32_t mtime = 0;  // seconds
    uint32_t uid = 0;
    uint32_t gid = 0;
    bool isMountPoint = false;
    std::string mountType;  // the mount's type name ("ext4"...), "" for no mount point,
                            // "remotefail" for a network mount that can't be reached
};

// true when a's name comes before b's, without regard to letter case
// (VLIBCUnicodeUTF8StrCaseCmp): names differing only in case are equal.
NORVO_API bool NvoLibSubDirNameLess(const _tag_SUBDIR_ENTRY_INFO_ &a, const _tag_SUBDIR_ENTRY_INFO_ &b);

// Appends the sub-folders of the absolute real directory path to out, then sorts all of out,
// records it held before included, with NvoLibSubDirNameLess (names equal but for case come in
// either order). Hidden names and links to folders are left out; a folder that is the mount
// point of an unreachable network share is kept with mountType "remotefail" and no other facts.
// Changes the working directory to path (intended: callers rely on it).
// 1 on success, with the error slot 0. 0 with the slot set, out unchanged: 400 for an empty or
// relative path, 408 when it does not exist or is no directory, 407 when the caller may not
// enter or read it, 402 for any other failure.
NORVO_API int NvoLibEnumSubDir(std::string path, std::vector<_tag_SUBDIR_ENTRY_INFO_> &out);
