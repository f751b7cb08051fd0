#include "platform/linux/connection/wire/KeyCache.h"

#include <cstring>

namespace halvox::platform::linux_::dbus {
namespace {

constexpr std::size_t kLengthBytes = 4;
// The bytes of a head after the key's text: a NUL, the length of the signature, its one character
// and another NUL.
constexpr std::size_t kTailBytes = 4;
constexpr std::string_view kBasicTypes = "ynqiuxtdbsog";

template <typename Word>
Word wordAt(const char* bytes) {
  Word word;
  std::memcpy(&word, bytes, sizeof word);
  return word;
}

// Hashes the first and the last characters, because keys often differ only in the last one.
std::uint64_t mixed(std::string_view text) {
  constexpr std::uint64_t kFactor = 0x9e3779b97f4a7c15U;
  const char* const begin = text.data();
  const char* const end = begin + text.size();
  std::uint64_t first = text.size();
  std::uint64_t last = 0;
  if (text.size() >= 8) {
    first += wordAt<std::uint64_t>(begin);
    last = wordAt<std::uint64_t>(end - 8);
  } else if (text.size() >= 4) {
    first += wordAt<std::uint32_t>(begin);
    last = wordAt<std::uint32_t>(end - 4);
  } else {
    for (const char character : text) first = first * 31 + static_cast<unsigned char>(character);
  }
  return (first ^ (last * kFactor)) * kFactor;
}

}  // namespace

// Returns the first of the text's two slots if it is free or has the text, else the second.
KeyCache::Slot& KeyCache::slotOf(std::string_view text) {
  static_assert(kSlots == 512, "the index below has nine bits");
  const std::size_t index = mixed(text) >> 55U;
  Slot& first = slots_[index];
  if (!first.key.has_value() || first.text == text) return first;
  return slots_[index ^ 1U];
}

KeyCache::Head KeyCache::find(std::string_view bytes) {
  if (bytes.size() < kLengthBytes + kTailBytes) return {};
  const std::size_t length = wordAt<std::uint32_t>(bytes.data());
  if (length > bytes.size() - kLengthBytes - kTailBytes) return {};
  const std::string_view text = bytes.substr(kLengthBytes, length);
  Slot& slot = slotOf(text);
  // Test for a free slot first. Invalid bytes (an empty text and zeros) can be equal to the content
  // of a free slot.
  if (!slot.key.has_value()) return {};
  if (wordAt<std::uint32_t>(text.data() + length) != slot.tail || text != slot.text) return {};
  const bool isRepeated = slot.dictionary == dictionary_;
  slot.dictionary = dictionary_;
  return {&*slot.key, kLengthBytes + length + kTailBytes, isRepeated};
}

void KeyCache::note(std::string_view bytes, const Key& key) {
  if (!key.isInterned()) return;
  const std::string_view text = key.text();
  const std::string_view tail = bytes.substr(kLengthBytes + text.size(), kTailBytes);
  if (tail[1] != 1 || kBasicTypes.find(tail[2]) == std::string_view::npos) return;
  Slot& slot = slotOf(text);
  slot.key = key;
  slot.text = text;
  slot.tail = wordAt<std::uint32_t>(tail.data());
  slot.dictionary = dictionary_;
}

}  // namespace halvox::platform::linux_::dbus
