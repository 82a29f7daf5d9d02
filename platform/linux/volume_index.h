// The volume index behind FILEIDXIsIndexEnable and FILEIDXResultGetAndTableGen, and its upkeep
// (platform/README.md, "The volume index").
#pragma once
#include <stdint.h>
#include <stdlib.h>
#include <unistd.h>

#include <functional>
#include <string>
#include <vector>

#include "fileidx.h"
#include "fileidx_sql.h"
#include "locked_file.h"

namespace norvo::platform {

// Whether a query of volume's index would work now, for this process.
[[nodiscard]] bool VolumeIndexUsable(const char *volume);

// Calls keep(record) for every live entry of volume's index in a share that both chains
// select, in index order; keep returns a platform code, non-zero ends the query with it.
// 0 or a platform code.
[[nodiscard]] int QueryVolumeIndex(const char *volume, const __tag_FI_SQL_COND *conditions,
                                   const __tag_FI_SQL_COND *folderConditions,
                                   const std::function<int(const __tag_FI_FILE_INFO_DATA &)> &keep);

// The trigrams (three bytes of folded text, see IndexText) that every name a pattern selects
// contains; empty when the pattern promises none. like: FI_OP_LIKE, else FI_OP_EQ.
[[nodiscard]] std::vector<std::string> NameTrigrams(const std::string &pattern, bool like);
// A name as the trigram table holds it: one byte per character, ASCII folded as
// VLIBCUnicodeUTF8LikeMatch folds it, any other character 0x01.
[[nodiscard]] std::string IndexText(const std::string &name);

// ---- shared by volume_index.cc (names, queries) and volume_index_upkeep.cc -------------------

// Where the index lives: <volume>/@fileidx/fileidx.db.
inline constexpr char kIndexDir[] = "@fileidx";
inline constexpr char kIndexName[] = "fileidx.db";
inline constexpr char kScratchName[] = "fileidx.db.new";
inline constexpr char kLockName[] = "fileidx.lock";
inline constexpr char kVersion[] = "2";
// The most names a folder keeps (more are left out of the index).
inline constexpr size_t kMaxNames = 1 << 24;
inline constexpr int kMaxDepth = 256;  // a descriptor per level is held while walking and querying
inline constexpr int kRootId = 1;

// A folder's names, sorted, front-coded: for each, one byte of the length it shares with the
// one before (names are at most 255 bytes), the rest of it, and a NUL. most: stop after so many.
[[nodiscard]] std::vector<std::string> SplitNames(const void *blob, int size, size_t most = SIZE_MAX);
// The same into out, whose strings are reused.
void SplitNames(const void *blob, int size, size_t most, std::vector<std::string> *out);
[[nodiscard]] std::string JoinNames(const std::vector<std::string> &names);

// Opens an absolute or relative directory path from "/" (or ".") without following a link;
// flags O_PATH or O_RDONLY. 0 and *out, or an errno.
[[nodiscard]] int OpenDirNoFollow(const std::string &path, int flags, FileDescriptor *out);
[[nodiscard]] std::string IndexDirOf(const char *volume);
// Opens volume's index (root's, checked as any file index database) read-only for this call.
[[nodiscard]] int OpenIndex(const char *volume, FileIdxDb *db);
// 0 when the index names the version this code writes; else a code.
[[nodiscard]] int CheckReady(sqlite3 *db);

// The effective user is root for the life of this object when the saved user is, so that root's
// index can be read; it is given back at the end (or the process ends rather than run on as root).
class RootForRead {
public:
    RootForRead() {
        uid_t real, effective, saved;
        if (getresuid(&real, &effective, &saved) == 0 && effective != 0 && saved == 0) {
            raised_ = seteuid(0) == 0;
            user_ = effective;
        }
    }
    ~RootForRead() {
        if (raised_ && seteuid(user_) != 0) {
            abort();
        }
    }
    RootForRead(const RootForRead &) = delete;
    RootForRead &operator=(const RootForRead &) = delete;

private:
    bool raised_ = false;
    uid_t user_ = 0;
};

[[nodiscard]] int BuildVolumeIndex(const char *volume);
[[nodiscard]] int UpdateVolumeIndex(const char *volume, unsigned long long *foldersRead);
[[nodiscard]] int VolumeIndexStatus(const char *volume, FI_INDEX_STATUS *status);
[[nodiscard]] int WatchVolumeIndex(const char *volume, const volatile int *stop);

}  // namespace norvo::platform
