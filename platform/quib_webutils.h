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
};
