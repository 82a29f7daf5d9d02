// The decision of the application privilege file, apart from reading it, so that it can be
// checked on any text.
#pragma once
#include <string_view>
#include <vector>

#include "name_list.h"
#include "settings_format.h"

namespace norvo::platform {

// False when line can't be trusted: a control character (NUL included) or invalid UTF-8, a
// quoted value without its closing quote or with text after it other than a "#" comment, or
// an unbalanced double quote among the holders.
[[nodiscard]] bool IsIntactPrivilegeLine(const SettingsLine &line);

// The verdict of lines (the parsed file) on matcher's user for priv, administrators aside:
// 1 granted; 0 absent, not granted, denied, or its line is damaged (fail closed); -1 when a
// holder could not be checked (slot set), which callers treat as not granted.
[[nodiscard]] int PrivilegeVerdict(const std::vector<SettingsLine> &lines, std::string_view priv,
                                   ListMatcher *matcher);

}  // namespace norvo::platform
