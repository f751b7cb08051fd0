#include "platform/linux/connection/wire/EndedSignal.h"

#include <cstddef>

namespace halvox::platform::linux_::dbus {

std::optional<std::uint32_t> readEndedSignal(const Frame& frame) {
  const MessageHeader& header = frame.header;
  if (header.type != MessageType::kSignal || header.interface != kConnectionInterface ||
      header.member != kEndedSignal || header.signature != kEndedSignature ||
      frame.body.size() != sizeof(std::uint32_t)) {
    return std::nullopt;
  }
  std::uint32_t serial = 0;
  for (std::size_t index = 0; index < sizeof serial; ++index) {
    const std::size_t place = header.bigEndian ? index : sizeof serial - 1 - index;
    serial = serial << 8U | std::to_integer<std::uint32_t>(frame.body[place]);
  }
  return serial;
}

}  // namespace halvox::platform::linux_::dbus
