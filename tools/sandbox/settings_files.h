// The appliance's settings files, kept as a model and rewritten whole after every change:
// key="value" files (/etc/quibinfo.conf, /etc.defaults/quibinfo.conf, the application
// privileges) and the shared-folder configuration in smb.conf syntax.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "appliance.h"

namespace norvo::testing::internal {

// One key="value" file; keys keep the order of their first setting.
class KeyValueFile {
public:
    explicit KeyValueFile(std::string path) : path_(std::move(path)) {}
    // Sets key and rewrites the file. Fails on a key or value that the format can't carry.
    void Set(const std::string &key, const std::string &value);
    void Write() const;

private:
    std::string path_;
    std::vector<std::pair<std::string, std::string>> entries_;
};

// The shared-folder configuration.
class ShareFile {
public:
    // Adds the share's section and rewrites the file. Fails on a duplicate name (share names
    // compare case-insensitively, as SMB's do). Returns the share's real path.
    std::string Add(const ShareSpec &share);
    void Write() const;

private:
    std::vector<ShareSpec> shares_;
};

}  // namespace norvo::testing::internal
