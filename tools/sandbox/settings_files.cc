#include "settings_files.h"

#include <strings.h>

#include "fail.h"
#include "fs_util.h"

#include "quib_paths.h"
#include "quib_share.h"

namespace norvo::testing::internal {

void KeyValueFile::Set(const std::string &key, const std::string &value) {
    if (key.empty() || key.find_first_of("=\"\n \t") != std::string::npos)
        Fail("bad setting key \"%s\" for %s", key.c_str(), path_.c_str());
    if (value.find_first_of("\"\n") != std::string::npos)
        Fail("the value of %s can't hold a quote or a line break", key.c_str());
    bool found = false;
    for (auto &entry : entries_) {
        if (entry.first == key) {
            entry.second = value;
            found = true;
        }
    }
    if (!found)
        entries_.emplace_back(key, value);
    Write();
}

void KeyValueFile::Write() const {
    std::string text;
    for (const auto &[key, value] : entries_)
        text += key + "=\"" + value + "\"\n";
    WriteWholeFile(path_, text, 0, 0, 0644);
}

std::string ShareFile::Add(const ShareSpec &share) {
    if (share.name.empty() || share.name.find_first_of("[]/\n") != std::string::npos)
        Fail("bad share name \"%s\"", share.name.c_str());
    for (const auto &existing : shares_)
        if (strcasecmp(existing.name.c_str(), share.name.c_str()) == 0)
            Fail("share %s already exists", share.name.c_str());
    ShareSpec added = share;
    if (added.path.empty())
        added.path = added.volume + "/" + added.name;
    for (const std::string *value :
         {&added.path, &added.comment, &added.noAccess, &added.readWrite, &added.readOnly})
        if (value->find('\n') != std::string::npos)
            Fail("share %s: a value holds a line break", share.name.c_str());
    shares_.push_back(added);
    Write();
    return added.path;
}

void ShareFile::Write() const {
    std::string text;
    for (const auto &share : shares_) {
        text += "[" + share.name + "]\n";
        text += "\tpath = " + share.path + "\n";
        const std::pair<const char *, const std::string *> lists[] = {{"comment", &share.comment},
                                                                      {"invalid users", &share.noAccess},
                                                                      {"write list", &share.readWrite},
                                                                      {"read list", &share.readOnly}};
        for (const auto &[key, value] : lists)
            if (!value->empty())
                text += std::string("\t") + key + " = " + *value + "\n";
        if (share.hidden)
            text += "\tbrowseable = no\n";
        if (share.encrypted)
            text += "\tencrypted = yes\n";
        if (share.restrict & SHARE_RESTRICT_NO_BROWSE)
            text += "\tdisable browsing = yes\n";
        if (share.restrict & SHARE_RESTRICT_NO_MODIFY)
            text += "\tdisable modify = yes\n";
        if (share.restrict & SHARE_RESTRICT_NO_DOWNLOAD)
            text += "\tdisable download = yes\n";
        text += std::string("\tacl = ") + (share.aclMode ? "yes" : "no") + "\n";
        text += "\n";
    }
    WriteWholeFile(QUIB_SHARE_CONF, text, 0, 0, 0644);
}

}  // namespace norvo::testing::internal
