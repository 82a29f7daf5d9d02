// A user path resolved once: the fields the search and upload checks work with.
#pragma once
#include <string>

#include "norvo/export.h"

struct NORVO_API PathInfo {
    std::string userPath;  // without trailing slashes
    std::string fullPath;  // the real path
    std::string shareName;
    std::string volumePath;
    std::string sharePath;  // the share's real path
};

class NORVO_API PathInfoFactory {
public:
    // Resolves path for user into out. 1 on success; 0 with the error slot and the platform
    // error set (400/0xD00 bad argument, 408/0xBE00 no such path, else 0x8000).
    static int create(const char *user, const std::string &path, PathInfo &out);
};
