// Names for the numbers the library answers with: share privileges, restriction flags and
// ACL permission masks.
#pragma once
#include <json/json.h>

#include <string>

namespace norvo::cli {

// "none", "read-only", "read-write"; "unknown" for anything else.
const char *PrivilegeName(int privilege);

// {"value":N,"names":[...]} and "0x2 (no-modify)" for share restriction flags.
Json::Value RestrictionJson(unsigned int flags);
std::string RestrictionText(unsigned int flags);

// The same for an ACL_PERM_* mask; the text says "all" for the full mask.
Json::Value AclJson(unsigned int mask);
std::string AclText(unsigned int mask);

}  // namespace norvo::cli
