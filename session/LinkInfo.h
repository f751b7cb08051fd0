#pragma once

#include <string_view>

namespace halvox {

// What the service tells the real-time framework of itself, in every session info.
inline constexpr int kLinkClientType = 19;
inline constexpr double kHVReportingVersionNumber = 2.1;
// And in every user info.
inline constexpr std::string_view kLinkClientName = "com.tarno.halvox";

}  // namespace halvox
