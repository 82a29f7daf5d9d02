// What no search reports, whichever way it finds its hits: what a walk never visits.
#pragma once
#include <string>

namespace norvo::search {

// Whether the path rest below the share folder root passes through a hidden name or a recycle
// bin (a share's "#recycle", or a home's, one level deeper). QUIBShareIsShareRecycle answers
// for the bin itself only, so each leading folder is asked.
bool OutOfSight(const std::string &root, const std::string &rest);

// The pattern of everything below the folder rest (FI_OP_PATH_LIKE): its own "*" and "\\" are
// escaped, so a folder named "*" reaches only its own entries. "*" for the share's top.
std::string BelowPattern(const std::string &rest);

}  // namespace norvo::search
