// Feeds hostile bytes to the reader of a history, like those that a damaged disk returns for a
// history that went on in a file. The bytes are read as a list of values and as the messages of a
// history.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <optional>
#include <span>
#include <utility>
#include <vector>

#include "platform/fake/FakePlatform.h"
#include "platform/fake/ServicesOf.h"
#include "platform/overflow.h"
#include "platform/services.h"
#include "session/CompactValue.h"
#include "session/MessageHistory.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Value;

void require(bool condition) {
  if (!condition) std::abort();
}

// Whatever was written, reading returns the bytes of this run.
class BytesOverflowService final : public platform::OverflowService {
 public:
  void setBytes(std::span<const std::byte> bytes) { bytes_.assign(bytes.begin(), bytes.end()); }

  [[nodiscard]] std::size_t memoryPerClient() const override { return 1; }
  std::optional<platform::Error> write(std::span<const std::byte> /*bytes*/,
                                       platform::OverflowPlace& place) override {
    place = {.offset = 0, .length = bytes_.size()};
    return std::nullopt;
  }
  std::optional<platform::Error> read(platform::OverflowPlace /*place*/,
                                      std::span<std::byte> bytes) override {
    require(bytes.size() == bytes_.size());
    std::copy(bytes_.begin(), bytes_.end(), bytes.begin());
    return std::nullopt;
  }
  void release(platform::OverflowPlace /*place*/) override {}

 private:
  std::vector<std::byte> bytes_;
};

// Its overflow service hides the fake one.
struct FuzzPlatform : platform::FakePlatform {
  FuzzPlatform() { platform::installServices(platform::servicesOf(*this, analytics)); }
  BytesOverflowService overflow;
};

// A value that was read can be printed, and written and read again with the same result.
void readValues(std::span<const std::byte> bytes) {
  CompactReader reader(bytes);
  Value previous;
  while (!reader.isAtEnd()) {
    Value value = reader.value(previous);
    require(reader.position() <= bytes.size());
    if (!reader.isIntact()) return;
    std::vector<std::byte> written;
    CompactWriter(written).append(previous, value);
    CompactReader again(written);
    require(platform::describe(again.value(previous)) == platform::describe(value));
    require(again.isIntact() && again.isAtEnd());
    previous = std::move(value);
  }
}

// Reading ends, with all bytes read or with an error.
void readMessages(std::span<const std::byte> bytes) {
  static FuzzPlatform& platform = *new FuzzPlatform;
  platform.overflow.setBytes(bytes);
  MessageHistory history;
  MessageHistory::Base& base = history.base(AudioEventCategory::kPlayback, AudioEventType::kStart);
  history.append(base, Dictionary{{"a", 1}, {"b", "text"}, {"c", 2.5}});
  history.append(base, Dictionary{{"d", 1}});
  require(!history.moveOut().has_value());

  MessageHistory::Reader reader(history);
  std::size_t messages = 0;
  while (const MessageHistory::Entry* entry = reader.next()) {
    static_cast<void>(entry->identifier());
    static_cast<void>(platform::describe(entry->message()));
    require(++messages <= bytes.size());
  }
  require(reader.next() == nullptr);
}

}  // namespace
}  // namespace halvox

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  // The input is copied into a block of its own, so that sanitizers see its exact end.
  const std::vector<std::uint8_t> block(data, data + size);
  const auto bytes = std::as_bytes(std::span(block));
  halvox::readValues(bytes);
  halvox::readMessages(bytes);
  return 0;
}
