// Feeds hostile text to the parsers of the kernel's files about sound cards.

#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "platform/linux/drivers/alsa/AlsaText.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace halvox::platform::linux_;
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  const auto status = parsePcmStatus(text);
  if (status.has_value() && status->state >= kPcmStates.size()) std::abort();
  const auto name = parsePcmName(text);
  if (name.has_value() && name->empty()) std::abort();
  static_cast<void>(parseCards(text));
  static_cast<void>(parseSysfsNumber(text));
  return 0;
}
