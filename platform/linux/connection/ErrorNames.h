#pragma once

#include <string_view>

// The names of the standard D-Bus errors with which the adapter refuses requests.
namespace halvox::platform::linux_::error_names {

inline constexpr std::string_view kAccessDenied = "org.freedesktop.DBus.Error.AccessDenied";
inline constexpr std::string_view kFailed = "org.freedesktop.DBus.Error.Failed";
inline constexpr std::string_view kInvalidArgs = "org.freedesktop.DBus.Error.InvalidArgs";
inline constexpr std::string_view kLimitsExceeded = "org.freedesktop.DBus.Error.LimitsExceeded";
inline constexpr std::string_view kNameHasNoOwner = "org.freedesktop.DBus.Error.NameHasNoOwner";
inline constexpr std::string_view kServiceUnknown = "org.freedesktop.DBus.Error.ServiceUnknown";
inline constexpr std::string_view kUnknownInterface = "org.freedesktop.DBus.Error.UnknownInterface";
inline constexpr std::string_view kUnknownMethod = "org.freedesktop.DBus.Error.UnknownMethod";
inline constexpr std::string_view kUnknownObject = "org.freedesktop.DBus.Error.UnknownObject";
inline constexpr std::string_view kUnknownProperty = "org.freedesktop.DBus.Error.UnknownProperty";

}  // namespace halvox::platform::linux_::error_names
