// The shares file fails closed: damage to a value of an intact configuration (a control byte,
// a stray double quote, a byte that breaks UTF-8) never lets a user further into a share,
// never unhides or unrestricts one, never moves a share to another path, never adds one.
// The input builds the intact configuration and then chooses the damage; the raw input is
// also parsed as a whole file, where only soundness is checked.
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>

#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "damage.h"
#include "name_list.h"
#include "quib_share.h"
#include "share_config.h"
#include "text_util.h"

namespace {

using norvo::fuzz::DamageValues;
using norvo::fuzz::Input;
using norvo::platform::ListMatcher;
using norvo::platform::ShareEntry;

// Host accounts every Linux has ("root", group "root"), and names NSS does not know.
const char *const kUsers[] = {"root", "alice", "carol"};
const char *const kEntries[] = {"root", "alice", "carol", "@root", "\"@CORP\\domain users\"", "@nogroup-x"};
const char *const kListKeys[] = {"invalid users", "write list", "read list"};

struct Text {
    std::string text;
    std::vector<std::pair<size_t, size_t>> values;  // where each value lies in text
    void Line(const std::string &key, const std::string &value) {
        text += "    " + key + " = ";
        values.emplace_back(text.size(), value.size());
        text += value + "\n";
    }
};

Text IntactConfiguration(Input *in) {
    Text out;
    const int sections = 1 + in->Byte() % 4;
    for (int s = 0; s < sections; ++s) {
        const std::string name = "s" + std::to_string(s);
        out.text += "[" + name + "]\n";
        out.Line("path", "/volume1/" + name);
        for (const char *key : kListKeys) {
            const uint8_t pick = in->Byte();
            std::string list;
            for (size_t e = 0; e < sizeof kEntries / sizeof *kEntries; ++e) {
                if (pick & (1u << e))
                    list += (list.empty() ? "" : (pick & 0x80 ? ", " : " ")) + std::string(kEntries[e]);
            }
            if (!list.empty())
                out.Line(key, list);
        }
        const uint8_t flags = in->Byte();
        if (flags & 1)
            out.Line("browseable", "no");
        if (flags & 2)
            out.Line("disable modify", "yes");
        if (flags & 4)
            out.Line("comment", "the \"best\" share");
    }
    return out;
}

// 0 no access, 1 read-only, 2 read-write, as SDK::Share answers; a list that can't be
// checked keeps the user out.
int Privilege(const ShareEntry &share, const char *user) {
    const auto in = [user](const std::string &list) {
        ListMatcher matcher(user);
        int result = 0;
        for (const std::string &entry : norvo::platform::SplitNameList(list)) {
            const int match = matcher.Matches(entry);
            if (match != 0)
                result = match;
            if (match == 1)
                break;
        }
        return result;
    };
    if (in(share.noAccess) != 0)
        return 0;
    if (in(share.readWrite) == 1)
        return 2;
    return in(share.readOnly) == 1 ? 1 : 0;
}

const ShareEntry *Named(const std::vector<ShareEntry> &shares, const std::string &name) {
    for (const ShareEntry &share : shares) {
        if (share.name == name)
            return &share;
    }
    return nullptr;
}

void CheckSound(const std::vector<ShareEntry> &shares) {
    std::set<std::string> names;
    for (const ShareEntry &share : shares) {
        if (share.path.size() < 2 || share.path[0] != '/' ||
            !names.insert(norvo::platform::ToLowerAscii(share.name)).second ||
            !norvo::platform::IsCleanConfigText(share.path) ||
            !norvo::platform::IsCleanConfigText(share.noAccess)) {
            abort();
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size);

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    CheckSound(
        norvo::platform::ParseShareConfig(std::string_view(reinterpret_cast<const char *>(data), size)));

    Input in(data, size);
    const Text intact = IntactConfiguration(&in);
    const std::vector<ShareEntry> before = norvo::platform::ParseShareConfig(intact.text);
    const std::vector<ShareEntry> after =
        norvo::platform::ParseShareConfig(DamageValues(intact.text, intact.values, &in));
    CheckSound(after);
    for (const ShareEntry &share : after) {
        const ShareEntry *was = Named(before, share.name);
        if (was == nullptr || was->path != share.path || (was->restrict & ~share.restrict) != 0 ||
            ((was->status & SHARE_STATUS_HIDDEN) && !(share.status & SHARE_STATUS_HIDDEN))) {
            abort();
        }
        for (const char *user : kUsers) {
            if (Privilege(share, user) > Privilege(*was, user))
                abort();
        }
    }
    return 0;
}
