// User-visible paths to real paths, on an appliance with the preset shares, a share whose
// folder is not named after it, and the home service. Whatever the path, a resolution that
// succeeds gives back the share name the path starts with, a real path inside that share's
// folder made of the folder and the rest of the path, and no "." or ".." component.
//
// Input: the user, a newline, the path; without a newline the whole input is alice's path.
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>
#include <strings.h>

#include <string>

#include "fuzz_appliance.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/pathinfo.h"

namespace {

void Check(bool ok) {
    if (!ok) {
        __builtin_trap();
    }
}

struct Share {
    const char *name;
    const char *path;
};
const Share kShares[] = {
    {"public", "/volume1/public"},
    {"photo", "/volume1/photo"},
    {"secret", "/volume1/secret"},
    {"media", "/volume2/deep/Media Files"},
};

// The folder the first component of path names for user; "" when it names none. Share names
// are matched ignoring case, as the platform does.
std::string FolderOf(const std::string &share, const std::string &user) {
    if (share == "home") {
        const std::string home = "/volume1/homes/" + user;
        char *real = realpath(home.c_str(), nullptr);
        std::string out = real != nullptr ? real : "";
        free(real);
        return out;
    }
    for (const Share &known : kShares) {
        if (strcasecmp(known.name, share.c_str()) == 0) {
            return known.path;
        }
    }
    return "";
}

bool HasDotComponent(const std::string &path) {
    size_t start = 0;
    while (start <= path.size()) {
        size_t end = path.find('/', start);
        if (end == std::string::npos) {
            end = path.size();
        }
        const std::string component = path.substr(start, end - start);
        if (component == "." || component == "..") {
            return true;
        }
        start = end + 1;
    }
    return false;
}

// The whole property for one successful resolution of path.
void CheckResolved(const std::string &path, const std::string &user, const std::string &full,
                   const std::string &share, const std::string &volume, const std::string &sharePath) {
    // The share name is the path's first component, which starts right after a single "/".
    Check(!share.empty() && path.compare(0, share.size() + 1, "/" + share) == 0);
    const std::string rest = path.substr(share.size() + 1);
    Check(rest.empty() || rest[0] == '/');
    const std::string folder = FolderOf(share, user);
    Check(!folder.empty() && sharePath == folder);
    Check(full == folder + rest);
    Check(full == folder || full.compare(0, folder.size() + 1, folder + "/") == 0);
    Check(!HasDotComponent(full));
    Check(!volume.empty() && folder.compare(0, volume.size(), volume) == 0 &&
          (folder.size() == volume.size() || folder[volume.size()] == '/'));
}

// The first or last non-empty component of the path's first 4094 bytes (the copy the token
// code works on); "" when there is none.
std::string ComponentOf(const std::string &path, bool first) {
    const std::string copy = path.substr(0, 4094);
    std::string found;
    size_t start = 0;
    while (start < copy.size()) {
        size_t end = copy.find('/', start);
        if (end == std::string::npos) {
            end = copy.size();
        }
        if (end > start) {
            found = copy.substr(start, end - start);
            if (first) {
                break;
            }
        }
        start = end + 1;
    }
    return found;
}

void CheckToken(const std::string &path, int first) {
    char *token = NvoLibGetTokOfPath(path.c_str(), first);
    const std::string want = path.find('/') == std::string::npos ? "" : ComponentOf(path, first != 0);
    Check(want.empty() ? token == nullptr : token != nullptr && want == token);
    free(token);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    norvo::fuzz::BuildAppliance([](norvo::testing::Appliance &appliance) {
        appliance.Basic();
        norvo::testing::ShareSpec media;
        media.name = "media";
        media.volume = "/volume2";
        media.path = "/volume2/deep/Media Files";
        media.readWrite = "@users";
        appliance.MakeDir("/volume2/deep").AddShare(media);
    });
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    std::string input(reinterpret_cast<const char *>(data), size);
    input = input.substr(0, input.find('\0'));  // the calls take C strings
    const size_t newline = input.find('\n');
    const std::string user = newline == std::string::npos ? "alice" : input.substr(0, newline);
    const std::string path = newline == std::string::npos ? input : input.substr(newline + 1);
    if (path.size() >= 4096) {
        return 0;  // longer than the path buffers the callers hold
    }

    CheckToken(path, 1);
    CheckToken(path, 0);

    // The plain form: the share's folder and the rest of the path, cut to the buffer.
    char out[4096];
    if (NvoLibTransFullPath(path.c_str(), out, sizeof(out)) == 0 && strlen(out) < sizeof(out) - 1) {
        const std::string share = ComponentOf(path, true);
        const std::string folder = FolderOf(share, user);
        CheckResolved(path, user, out, share, folder.substr(0, folder.find('/', 1)), folder);
    }

    std::string full, share, volume, sharePath;
    NvoLibSetErr(0);
    if (NvoFullPathGet(path.c_str(), full, share, volume, sharePath, user) == 1) {
        CheckResolved(path, user, full, share, volume, sharePath);
    } else {
        Check(NvoLibGetErr() != 0);
    }

    PathInfo info;
    NvoLibSetErr(0);
    if (PathInfoFactory::create(user.c_str(), path, info) == 1) {
        // Trailing slashes are dropped before resolving.
        Check(path.compare(0, info.userPath.size(), info.userPath) == 0 &&
              path.find_first_not_of('/', info.userPath.size()) == std::string::npos);
        CheckResolved(info.userPath, user, info.fullPath, info.shareName, info.volumePath, info.sharePath);
    } else {
        Check(NvoLibGetErr() != 0);
    }
    return 0;
}
