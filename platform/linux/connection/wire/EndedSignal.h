#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/linux/connection/wire/Frame.h"

// The last frame that the service sends on a connection at an orderly end. Its one argument, of
// type "u", is the serial of the last request of this connection that the service has taken, or 0
// if it has taken none. The service carries out that request and all before it, and none after it.
namespace halvox::platform::linux_::dbus {

inline constexpr std::string_view kConnectionInterface = "com.tarno.halvox.Connection";
inline constexpr std::string_view kEndedSignal = "Ended";
inline constexpr std::string_view kEndedSignature = "u";

// Returns the serial in this signal, or nothing if the frame is another message.
[[nodiscard]] std::optional<std::uint32_t> readEndedSignal(const Frame& frame);

}  // namespace halvox::platform::linux_::dbus
