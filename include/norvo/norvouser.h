// Identity switching: the request's user becomes the process's effective identity, so the
// kernel judges every file access as that user's; and the owner of a created file.
#pragma once
#include "norvo/export.h"

NORVO_BEGIN_C

// Takes user's supplementary groups (only while the process is root), effective gid, then
// effective uid, in that order: after the uid has left root the others can't be set. With a
// login sid the ids of that login are asked first. Administrators keep effective uid 0 with
// their own gid. 0 on success; -1 with 400 (null user), 403 (no such user), 401 (anything else,
// a refused setegid or seteuid too: the process never carries on as root by mistake). Nothing
// is restored: the process ends with its request.
NORVO_API int NvoLibUGIDSet(const char *sid, const char *user);
// Sets the effective gid; gid (unsigned)-1 is unknown and asked of the sid's login. 0, or -1
// with 400 (null user, or neither gid nor sid) or 401 (still unknown, or setegid refused).
NORVO_API int NvoLibEGIDSet(const char *sid, const char *user, unsigned int gid);
// Sets the effective uid: 0 for a member of the administrators group whatever uid says (on
// purpose: administrator requests run with full rights), else uid, or the sid's login's uid
// when uid is (unsigned)-1. 0, or -1 with 400, or 401 (membership test failed, uid unknown,
// seteuid refused).
NORVO_API int NvoLibEUIDSet(const char *sid, const char *user, unsigned int uid);
// Gives file to owner (uid and primary gid) without following a link at file. 0 on success,
// and without a change on FAT, network and disk-image file systems, which have no Unix owners;
// -1 on failure (logged, but not for an unknown owner). The error slot is left alone.
NORVO_API int NvoLibChown2Admin(const char *file, const char *owner);

NORVO_END_C
