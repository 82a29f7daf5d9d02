// What the file system tells about one entry of a directory, read once: the record the
// directory listing keeps per entry, FillFileInfo copies into a DIRENTRY_INFO, and a walk or a
// search can reuse. Owner names and the paths are not facts of the entry: they are added where
// a record is built.
#pragma once
#include <stdint.h>

#include <string>

#include "norvo/norvoenum.h"

namespace norvo {

struct EntryFacts {
    bool isdir = false;
    uint64_t size = 0;                                    // NVO_INFO_SIZE
    uint32_t mode = 0;                                    // NVO_INFO_PERM
    uint32_t aclPrivilege = 0;                            // NVO_INFO_PERM
    bool isAclMode = false;                               // NVO_INFO_PERM
    int32_t mtime = 0, ctime = 0, crtime = 0, atime = 0;  // NVO_INFO_TIME
    uint32_t uid = 0, gid = 0;                            // NVO_INFO_OWNER
    const char *mountPointType = "";                      // a literal: "", "iso", "remote" or "remotefail"
};

enum class EntryVerdict {
    kKeep,         // listed, with the facts info asked for
    kSkip,         // not listed: of a kind not listed or not wanted, or gone
    kUnreachable,  // listed although its stat failed: a folder on a network mount that is gone
    kFail,         // the listing fails: the error slot is set (except for an I/O error) and logged
};

// Reads the facts of the entry at realPath (dtype: the directory reader's type byte, 0 when
// unknown), keeping only directories and regular files that type wants, as far as info asks.
// isdir is set from dtype first and from the stat once it is read. Inside a directory pass the
// stat and the ACL answers come from the pass's directory.
EntryVerdict ReadEntryFacts(NorvoMountStatus &mounts, const char *realPath, _tag_dir_entry_type_ type,
                            unsigned char dtype, int info, EntryFacts *facts);

// Copies the facts info asks for (size, owner with its names, times, permissions) into entry.
void CopyFacts(const EntryFacts &facts, int info, NorvoUserEnum &names, DIRENTRY_INFO *entry);

// The extension of name in lower case, "" without one (the "type" of a file).
void LowerExtension(const char *name, std::string *type);

}  // namespace norvo
