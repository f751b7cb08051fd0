#include "platform/linux/connection/wire/TailCache.h"

#include <cstdint>
#include <cstring>

namespace halvox::platform::linux_::dbus {
namespace {

// The largest alignment of a type in the wire format.
constexpr std::size_t kAlignment = 8;

}  // namespace

// Hashes the last bytes. In most messages these are the last reporter ID, in which messages differ
// most.
std::size_t TailCache::indexOf(std::string_view bytes) {
  std::uint64_t last = 0;
  std::memcpy(&last, bytes.data() + bytes.size() - sizeof last, sizeof last);
  static_assert(kSlots == 16, "the index below has four bits");
  return (last * 0x9e3779b97f4a7c15U) >> 60U;
}

const std::vector<Value>* TailCache::find(const Source& source) const {
  if (source.bytes.size() > kMostBytes || source.bytes.size() < sizeof(std::uint64_t)) {
    return nullptr;
  }
  const Slot& slot = slots_[indexOf(source.bytes)];
  const bool isSame = slot.bytes == source.bytes && slot.types == source.types &&
                      slot.alignment == source.position % kAlignment &&
                      slot.bigEndian == source.bigEndian;
  return isSame ? &slot.values : nullptr;
}

void TailCache::note(const Source& source, const Value* begin, const Value* end) {
  if (source.bytes.size() > kMostBytes || source.bytes.size() < sizeof(std::uint64_t)) return;
  Slot& slot = slots_[indexOf(source.bytes)];
  slot.types = source.types;
  slot.bytes = source.bytes;
  slot.alignment = source.position % kAlignment;
  slot.bigEndian = source.bigEndian;
  slot.values.assign(begin, end);
}

}  // namespace halvox::platform::linux_::dbus
