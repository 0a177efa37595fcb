// The library's version symbols.
#pragma once

namespace kivi {

inline constexpr double KiviOSSDKVersionNumber = 1.0;
inline constexpr const char* KiviOSSDKVersionString = "1.0.0";

}  // namespace kivi
