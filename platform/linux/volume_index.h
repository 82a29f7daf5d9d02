// The volume index behind FILEIDXIsIndexEnable and FILEIDXResultGetAndTableGen, and its upkeep
// (platform/README.md, "The volume index").
#pragma once
#include <functional>
#include <string>
#include <vector>

#include "fileidx.h"

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

[[nodiscard]] int BuildVolumeIndex(const char *volume);
[[nodiscard]] int UpdateVolumeIndex(const char *volume, unsigned long long *foldersRead);
[[nodiscard]] int VolumeIndexStatus(const char *volume, FI_INDEX_STATUS *status);
[[nodiscard]] int WatchVolumeIndex(const char *volume, const volatile int *stop);

}  // namespace norvo::platform
