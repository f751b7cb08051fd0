#pragma once

#include <string_view>

// The names under which clients address the bus itself.
namespace halvox::platform::linux_::bus_names {

inline constexpr std::string_view kBus = "org.freedesktop.DBus";  // its name and its interface
inline constexpr std::string_view kBusPath = "/org/freedesktop/DBus";

}  // namespace halvox::platform::linux_::bus_names
