// The source names that lead every log line and platform error of a module.
#pragma once

namespace norvo {
inline constexpr char kNorvoDir[] = "norvodir.cpp";
inline constexpr char kNvoMan[] = "nvoman.cpp";
inline constexpr char kNorvoMisc[] = "norvomisc.cpp";
inline constexpr char kNorvoEnum[] = "norvoenum.cpp";
inline constexpr char kNorvoSearch[] = "norvosearch.cpp";
inline constexpr char kNorvoProgress[] = "norvoprogress";
inline constexpr char kNorvoUser[] = "norvouser.cpp";
inline constexpr char kNorvoUpload[] = "norvoupload.cpp";
}  // namespace norvo
