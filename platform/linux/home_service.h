// The home service's settings, for the calls outside home_service.cc that need them.
#pragma once
#include <string>

namespace norvo::platform {

// The normalised homes root of QUIB_INFO_CONF ("" when unset, relative or "/"; a missing file
// means unset). false with 0x0900 when the settings exist but can't be read.
[[nodiscard]] bool HomesRoot(std::string *root);

}  // namespace norvo::platform
