#include "bit_names.h"

#include <stdio.h>

#include <vector>

#include "quib_fs.h"
#include "quib_share.h"

namespace norvo::cli {
namespace {

struct BitName {
    unsigned int bit;
    const char *name;
};

constexpr BitName kRestrictions[] = {
    {SHARE_RESTRICT_NO_BROWSE, "no-browse"},
    {SHARE_RESTRICT_NO_MODIFY, "no-modify"},
    {SHARE_RESTRICT_NO_DOWNLOAD, "no-download"},
};

constexpr BitName kAclBits[] = {
    {ACL_PERM_EXECUTE, "execute"},
    {ACL_PERM_WRITE, "write"},
    {ACL_PERM_READ, "read"},
    {ACL_PERM_APPEND, "append"},
    {ACL_PERM_READ_XATTR, "read-xattr"},
    {ACL_PERM_WRITE_XATTR, "write-xattr"},
    {ACL_PERM_DELETE_CHILD, "delete-child"},
    {ACL_PERM_READ_ATTR, "read-attr"},
    {ACL_PERM_WRITE_ATTR, "write-attr"},
    {ACL_PERM_DELETE, "delete"},
    {ACL_PERM_READ_ACL, "read-acl"},
    {ACL_PERM_WRITE_ACL, "write-acl"},
    {ACL_PERM_CHANGE_OWNER, "change-owner"},
};

std::string Hex(unsigned int value, int digits) {
    char buf[16];
    snprintf(buf, sizeof(buf), "0x%0*x", digits, value);
    return buf;
}

// The names of the set bits in table order; bits the table lacks appear as hex.
template <size_t N>
std::vector<std::string> Names(unsigned int value, const BitName (&table)[N]) {
    std::vector<std::string> names;
    unsigned int known = 0;
    for (const BitName &entry : table) {
        known |= entry.bit;
        if ((value & entry.bit) != 0) {
            names.emplace_back(entry.name);
        }
    }
    for (unsigned int bit = 1; bit != 0; bit <<= 1) {
        if ((value & bit & ~known) != 0) {
            names.push_back(Hex(bit, 1));
        }
    }
    return names;
}

Json::Value NamesJson(unsigned int value, const std::vector<std::string> &names) {
    Json::Value out(Json::objectValue);
    out["value"] = value;
    out["names"] = Json::Value(Json::arrayValue);
    for (const std::string &name : names) {
        out["names"].append(name);
    }
    return out;
}

std::string NamesText(const std::string &hex, const std::vector<std::string> &names) {
    std::string joined;
    for (const std::string &name : names) {
        joined += (joined.empty() ? "" : ", ") + name;
    }
    return hex + " (" + (joined.empty() ? "none" : joined) + ")";
}

}  // namespace

const char *PrivilegeName(int privilege) {
    switch (privilege) {
        case 0:
            return "none";
        case 1:
            return "read-only";
        case 2:
            return "read-write";
        default:
            return "unknown";
    }
}

Json::Value RestrictionJson(unsigned int flags) {
    return NamesJson(flags, Names(flags, kRestrictions));
}

std::string RestrictionText(unsigned int flags) {
    return NamesText(Hex(flags, 1), Names(flags, kRestrictions));
}

Json::Value AclJson(unsigned int mask) {
    return NamesJson(mask, Names(mask, kAclBits));
}

std::string AclText(unsigned int mask) {
    if (mask == ACL_PERM_ALL) {
        return Hex(mask, 4) + " (all)";
    }
    return NamesText(Hex(mask, 4), Names(mask, kAclBits));
}

}  // namespace norvo::cli
