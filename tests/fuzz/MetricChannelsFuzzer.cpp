// Feeds hostile text to the parser of driver counters in text files.

#include <cstdint>
#include <cstdlib>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/drivers/textfile/MetricChannels.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace halvox::platform::linux_;
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  const auto made = MetricChannels::from(text);
  if (const auto* error = std::get_if<MetricError>(&made)) {
    if (error->what.empty()) std::abort();
    return 0;
  }
  for (const MetricChannel& channel : std::get<std::vector<MetricChannel>>(made)) {
    if (channel.values.size() != channel.description.valueCount()) std::abort();
    std::int64_t lower = 0;
    for (const BucketBounds& bounds : channel.description.buckets) {
      if (bounds.lower != lower || bounds.upper < bounds.lower) std::abort();
      lower = bounds.upper;
    }
  }
  return 0;
}
