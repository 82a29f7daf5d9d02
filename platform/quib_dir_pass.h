// A pass over the entries of one directory, such as a listing makes: the file calls asked about
// each entry in turn share what one entry's answers have in common, so an entry costs one statx
// (and, for a permission mask, one read of its ACL) however many of these calls ask about it.
//
// While a pass is open on a thread, VLIBCFileLStat, QUIBACLPermGet and QUIBACLIsSupport (with
// fd -1), called on that thread with a path that names a direct entry of the pass's directory
// (the directory's path exactly as given to QUIBDirPassBegin, "/", then one name), answer as a
// snapshot:
//  - the name is looked up in the directory as it was opened when the pass began, not by walking
//    the whole path again;
//  - the first call about an entry reads its state; further calls about that same entry, until
//    another entry is asked about, reuse it;
//  - permissions are judged for the caller's identity (file-system ids, groups, capabilities) as
//    it was at the first permission question of the pass, and the directory's own facts (what
//    deleting an entry needs) are read once.
// Calls about any other path, or on another thread, behave as outside a pass. Passes nest: the
// one begun last is the thread's current pass until it ends.
#pragma once
#include "platform_export.h"

typedef struct QUIBDirPass QUIBDirPass;

QUIB_BEGIN_C

// Opens a pass over the directory at dirPath (followed if it is a link) for the calling
// thread. The pass needs no read permission on the directory, only the right to reach it.
// Null on failure, with errno and the error slot set: EINVAL (0x0D00) for a null or empty path,
// ENAMETOOLONG (0xC300) for 4096 bytes or more, ENOTDIR (0x0700), ENOENT (0x0600), EACCES
// (0x0300), ENOMEM (0x2B00), or the kernel's errno. A caller that gets null just goes on
// without a pass: every answer is the same, only dearer.
QUIB_API QUIBDirPass *QUIBDirPassBegin(const char *dirPath);

// The same over a directory the caller has open already (dirFd; any open mode, O_PATH too),
// known by dirPath: the pass keeps its own duplicate, so the directory the entries are read in
// is the one the caller opened, whatever dirPath names by now. Null on failure as above, also
// EBADF (0x8100) for a descriptor that is not open and ENOTDIR (0x0700) for one that is no
// directory.
QUIB_API QUIBDirPass *QUIBDirPassBeginAt(int dirFd, const char *dirPath);

// Ends the pass and frees it; call it on the thread that began the pass. Null is ignored. The
// thread's current pass becomes the one that was current before it.
QUIB_API void QUIBDirPassEnd(QUIBDirPass *pass);

QUIB_END_C
