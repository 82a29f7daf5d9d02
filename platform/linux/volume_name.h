// Volume names in paths, shared by VolumePathParse and the data-mount table.
#pragma once
#include <string_view>

namespace norvo::platform {

// The kind (VOLUME_KIND_*) of the volume path lies on, with the length of its volume prefix
// ("/volume1" of "/volume1/photo") in *prefixLength; 0 when path lies on no volume.
[[nodiscard]] int VolumeKindOf(std::string_view path, size_t *prefixLength);

}  // namespace norvo::platform
