// Reads arbitrary bytes as the service's configuration. The result must be the same each time, and
// a mistake must be one line of text that begins with the file.

#include <cstdint>
#include <cstdlib>
#include <span>
#include <string_view>

#include "platform/linux/base/Utf8.h"
#include "platform/linux/configuration/Configuration.h"
#include "tests/fuzz/InputFile.h"

namespace {

using namespace halvox::platform::linux_;
using halvox::fuzzing::InputFile;
using halvox::fuzzing::require;

bool isOneLine(std::string_view text) {
  for (const char letter : text) {
    if (static_cast<unsigned char>(letter) < 0x20 || letter == 0x7F) return false;
  }
  return !text.empty() && isUtf8WithoutNul(text);
}

void read(std::span<const std::uint8_t> bytes) {
  const InputFile file(bytes);
  ::setenv("HALVOX_CONFIG", file.path().c_str(), 1);
  const DefaultPlaces places{"/run/halvox/reporting.sock", "/var/lib/halvox"};
  const auto configuration = loadConfiguration(places);
  const auto again = loadConfiguration(places);
  require(configuration.has_value() == again.has_value());
  if (configuration.has_value()) {
    require(configuration->listener.socket.is_absolute());
    require(configuration->storage.directory.is_absolute());
    require(!configuration->link.servers.empty());
    require(configuredSocket().has_value());
  } else {
    require(isOneLine(configuration.error().message));
    require(configuration.error().message.starts_with(file.path()));
    require(configuration.error().message == again.error().message);
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  read({data, size});
  return 0;
}
