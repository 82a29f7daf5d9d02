// Checks of names and paths before anything is created, the scratch directory of a volume,
// and whether a request may use the file manager at all.
#pragma once
#include <string>

#include "norvo/export.h"

class WebMan;

NORVO_BEGIN_C

// 1 when name may be created, 0 with 418 when it is reserved (".", "..", holds ":" or "/",
// begins with "._", or is a platform extended-attribute directory); 0 with 400 when empty.
NORVO_API int NvoCheckReservedName(const char *name);
// 0 when name may be created in dir: not reserved and, on FAT, none of \ / : * ? " > < | CR LF
// (419). -1 with the error slot set otherwise.
NORVO_API int NvoCheckFileName(const char *dir, const char *name);
// Checks a real path before an operation that may create its missing tail. With findExisting
// the longest existing leading part is checked instead (and stored in *existing when given);
// mode is an access request for ACLAccess, 32 for none. Every component must be a
// non-reserved name. 0 when acceptable; -1 with the error slot set (400, 401, 407, 408, 410,
// 418 and the codes of ACLAccess).
NORVO_API int NvoCheckPath(const char *path, bool findExisting, int mode, std::string *existing);
// Makes "<volume>/@tmp" and "<volume>/@tmp/norvo" (mode 0777) where missing; leaves the
// process umask at 0. 0 on success, -1 on failure.
NORVO_API int NvoCreateTmpDir(const char *volume);
// true only when the request is logged in and its user holds the file-manager application
// privilege.
NORVO_API bool IsAuthorized(WebMan &webman, const char *text);

NORVO_END_C
