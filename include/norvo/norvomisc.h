// Permission conversions, ACL checks, and the share-level list, download and upload checks.
#pragma once
#include <string>

#include "norvo/export.h"

// Mode digits ("rwxr-x---" or 0750 give 750): the octal digits read as a decimal number.
NORVO_API int GetPrivilege(const char *mode);
NORVO_API int GetPrivilege(unsigned int mode);
// The nine-character permission string of a mode ("rwxr-xr-x").
NORVO_API std::string GetPrivilegeStr(unsigned int mode);
// The ACL permission mask of path for the effective identity; 8191 (all) when it can't be read.
NORVO_API unsigned int GetACLPrivilege(const char *path);
// 0 when the effective identity may do what request asks on path (bits 0x1 read, 0x2 write,
// 0x4 execute, 0x8 delete, 0x10 append), -1 when not (407) or on failure (408, 411).
NORVO_API int ACLAccess(const char *path, int request);
// 1 when the directory can be entered and opened, else 0 with 402, 407 or 408. Changes the
// process's working directory to it.
NORVO_API int CheckDirListPrivilege(const char *path);

NORVO_BEGIN_C

// 1 when user may list the user-visible path, 0 when not.
NORVO_API int CheckShareListPrivilege(const char *user, const char *sid, const char *path);
// 1 when user may download from the user-visible path, 0 when not (407 set).
NORVO_API int CheckShareDownloadPrivilege(const char *user, const char *sid, const char *path);
// 1 when user may upload to the user-visible path. *type (in/out) is the upload type: a share
// with restriction flags forces 2; with type 0 an existing target is refused (414).
NORVO_API int CheckShareUploadPrivilege(const char *user, const char *sid, const char *path, int *type);
// 1 when the file system under the real path is one the file manager supports, else 0.
NORVO_API int NvoLibFileSystemSupported(const char *path);
// *encrypted = whether the share is encrypted. 1 on success; 0 with 408 when there is no such
// share. Home shares are never encrypted.
NORVO_API int NvoLibCheckEncryptShare(const std::string &share, bool *encrypted);

NORVO_END_C
