// Helpers of the web programs about the files they show.
#pragma once
#include <string>

#include "platform_export.h"

class QUIB_API WebUtils {
public:
    // true when path is the directory of a mount: the kernel's mount-root mark (on kernels
    // without it, a device differing from the parent's); when path can't be examined (a network
    // mount whose server is gone), whether the mount table lists it, compared lexically. A final
    // symbolic link is not followed: a link is never a mount point. false for anything else,
    // including a missing path; false with the error slot set for a null-containing, empty or
    // over-long path (0x0D00, 0xC300).
    static bool IsMountPoint(const std::string &path);
    // The file-system type name ("ext4", "fuse.sshfs"...) of the mount whose directory is path,
    // from the mount table alone, compared lexically: the mount itself is never touched, so a
    // network mount whose server is gone still answers. Of mounts stacked on one directory the
    // topmost. "" when the table lists no mount there (a link to one included: links are not
    // followed), and "" with the error slot set for a bad path (as IsMountPoint) or a table or
    // working directory that can't be read.
    static std::string getMountType(const std::string &path);
    // The modification time of path (a link followed) as decimal seconds since the epoch, the
    // version stamp of the web interface's resources; "" with the slot set when it can't be
    // examined (the errno's code) or for a bad path (as IsMountPoint).
    static std::string GetModifyTime(const std::string &path);
};
