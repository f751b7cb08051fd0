#include "client/EncodedDictionary.h"

#include <algorithm>
#include <bit>
#include <string>

#include "client/EncodedArray.h"
#include "platform/linux/connection/wire/ValueDecoder.h"

namespace halvox::client {
namespace {

namespace dbus = platform::linux_::dbus;

// How many bytes an entry needs in addition to its key and its variant: for padding before and
// after it, the length of the key and the key's NUL.
constexpr std::size_t kKeyRoom = 24;

constexpr std::size_t roundUp(std::size_t size) { return (size + 7) & ~std::size_t{7}; }

// The results of one pass over a key.
struct KeyScan {
  std::uint32_t hash = 0;
  bool isPlain = false;  // ASCII without NUL; anything else needs the full test
};

// Reads a key of 8 to 32 bytes as two or four words that may overlap. The processor could not
// predict the end of a loop. The hash needs no secret, because the program itself chooses its keys.
inline KeyScan scan(std::string_view key) {
  constexpr std::uint64_t kFactors[] = {0x9E3779B97F4A7C15, 0xC2B2AE3D27D4EB4F, 0x165667B19E3779F9,
                                        0xD6E8FEB86659FD93};
  const char* const at = key.data();
  const std::size_t size = key.size();
  std::uint64_t hash = size;
  std::uint64_t signs = 0;
  const auto take = [&](std::uint64_t word, std::uint64_t factor) {
    hash += word * factor;
    signs |= highBits(word);
  };
  if (size >= 8) {
    take(load<std::uint64_t>(at), kFactors[0]);
    take(load<std::uint64_t>(at + size - 8), kFactors[1]);
    if (size > 16) {
      take(load<std::uint64_t>(at + 8), kFactors[2]);
      take(load<std::uint64_t>(at + size - 16), kFactors[3]);
      for (std::size_t middle = 16; middle + 16 < size; middle += 8) {
        hash = std::rotl(hash, 29) * kFactors[0];
        take(load<std::uint64_t>(at + middle), kFactors[2]);
      }
    }
  } else if (size >= 4) {
    const std::uint64_t first = load<std::uint32_t>(at);
    take(first | std::uint64_t{load<std::uint32_t>(at + size - 4)} << 32U, kFactors[0]);
  } else {
    for (const char character : key) {
      hash = hash * kFactors[0] + static_cast<unsigned char>(character);
      signs |= static_cast<signed char>(character) > 0 ? 0 : kEachHighBit;
    }
  }
  return {static_cast<std::uint32_t>(hash ^ (hash >> 32U)), (signs & kEachHighBit) == 0};
}

char* aligned(char* at, std::size_t alignment) {
  return at + ((0 - reinterpret_cast<std::uintptr_t>(at)) & (alignment - 1));
}

// Each of these functions overwrites a variant with a value of the same type and size. Returns
// false if the variant has another type or size.
bool overwrite(char* variant, const WireNumber& number) {
  if (variant[0] != 1 || variant[1] != number.type) return false;
  char* const at = aligned(variant + 3, number.size);
  // Most numbers have eight bytes. A copy of constant size is one store instead of a call.
  if (number.size == 8) {
    std::memcpy(at, number.bytes.data(), 8);
  } else {
    std::memcpy(at, number.bytes.data(), number.size);
  }
  return true;
}

bool overwrite(char* variant, const platform::Date& date) {
  if (variant[0] != 3 || variant[1] != '(') return false;
  put(aligned(variant + 5, 8), date.secondsSince1970);
  return true;
}

bool overwrite(char* variant, const WireText& text) {
  if (variant[0] != 1 || variant[1] != 's') return false;
  char* const at = aligned(variant + 3, 4);
  std::uint32_t length = 0;
  std::memcpy(&length, at, sizeof length);
  if (length != text.text.size()) return false;
  copyText(at + sizeof length, text.text);
  return true;
}

template <typename WireForm>
bool overwrite(char* /*variant*/, const WireForm& /*value*/) {
  return false;
}

}  // namespace

void EncodedDictionary::Entries::reserveOne() {
  if (size_ < capacity_) return;
  std::vector<Entry> grown(2 * capacity_);
  std::copy(begin_, begin_ + size_, grown.begin());
  heap_ = std::move(grown);
  begin_ = heap_.data();
  capacity_ = heap_.size();
}

bool EncodedDictionary::hasKey(const Entry& entry, std::string_view key) const {
  const char* const at = bytes_.data() + std::size_t{entry.start} * 8;
  std::uint32_t length = 0;
  std::memcpy(&length, at, sizeof length);
  return std::string_view(at + sizeof length, length) == key;
}

// Returns the index of the key's entry, or size() if there is no such key.
inline std::size_t EncodedDictionary::find(std::string_view key, std::uint32_t hash) const {
  return (seen_ & seenBit(hash)) == 0 ? size() : findSeen(key, hash);
}

std::size_t EncodedDictionary::findSeen(std::string_view key, std::uint32_t hash) const {
  const std::size_t count = entries_.size();
  if (table_.empty()) {
    for (std::size_t index = 0; index < count; ++index) {
      if (entries_[index].hash == hash && hasKey(entries_[index], key)) return index;
    }
    return count;
  }
  const std::size_t mask = table_.size() - 1;
  for (std::size_t place = hash & mask; table_[place] != 0; place = (place + 1) & mask) {
    const std::size_t index = table_[place] - 1;
    if (entries_[index].hash == hash && hasKey(entries_[index], key)) return index;
  }
  return count;
}

char* EncodedDictionary::variantOf(std::size_t index, std::string_view key) {
  return startOf(index) + sizeof(std::uint32_t) + key.size() + 1;
}

// Makes space for one more entry. All steps that can fail are here.
inline void EncodedDictionary::reserve(std::size_t room) {
  bytes_.reserve(room);
  if (entries_.size() >= kInlineEntries) reserveEntry();
}

void EncodedDictionary::reserveEntry() {
  const std::size_t most = entries_.size() + 1;
  entries_.reserveOne();
  if (most > kMostWithoutTable && table_.size() < 2 * most) {
    table_ = std::vector<std::uint32_t>(std::bit_ceil(4 * most));
    fillTable();
  }
}

void EncodedDictionary::fillTable() {
  std::fill(table_.begin(), table_.end(), 0);
  for (std::size_t index = 0; index < entries_.size(); ++index) addToTable(index);
}

void EncodedDictionary::addToTable(std::size_t index) {
  if (table_.empty()) return;
  const std::size_t mask = table_.size() - 1;
  std::size_t place = entries_[index].hash & mask;
  while (table_[place] != 0) place = (place + 1) & mask;
  table_[place] = static_cast<std::uint32_t>(index + 1);
}

template <typename WireForm>
bool EncodedDictionary::setVariant(std::string_view key, const WireForm& value) {
  const auto [hash, isPlain] = scan(key);
  const std::size_t index = find(key, hash);
  const bool exists = index < entries_.size();
  if (exists && overwrite(variantOf(index, key), value)) return true;
  if (!exists && !isPlain && !platform::linux_::isUtf8WithoutNul(key)) return false;
  reserve(kKeyRoom + key.size() + variantRoom(value));
  const std::size_t sizeBefore = bytes_.size();
  append(key, hash, value);
  if (exists) {
    moveLastTo(index, sizeBefore);
    countLevels();
  } else {
    addToTable(index);
    seen_ |= seenBit(hash);
    levels_ = std::max(levels_, variantLevels(value));
  }
  return true;
}

template <typename WireForm>
void EncodedDictionary::append(std::string_view key, std::uint32_t hash, const WireForm& value) {
  char* const start = padded(bytes_.reserve(0), 8);
  bytes_.setEnd(putVariant(putKey(start, key), value));
  entries_.append({.start = static_cast<std::uint32_t>((start - bytes_.data()) / 8),
                   .hash = hash,
                   .levels = static_cast<std::uint8_t>(variantLevels(value)),
                   .padding = static_cast<std::uint8_t>(roundUp(bytes_.size()) - bytes_.size())});
}

// Moves the last entry to the place of another entry, which it replaces. `sizeBefore` is the number
// of bytes before the last entry was appended.
void EncodedDictionary::moveLastTo(std::size_t index, std::size_t sizeBefore) {
  const std::size_t last = entries_.size() - 1;
  Entry made = entries_[last];
  char* const from = startOf(last);
  char* const to = startOf(index);
  const auto madeBytes = static_cast<std::size_t>(bytes_.data() + bytes_.size() - from);
  made.start = entries_[index].start;
  entries_[index] = made;
  entries_.removeLast();
  if (index + 1 == last) {
    std::memmove(to, from, madeBytes);
    bytes_.setEnd(to + madeBytes);
    return;
  }
  char* const next = startOf(index + 1);
  const std::size_t padded = madeBytes + made.padding;
  std::memset(from + madeBytes, 0, made.padding);
  std::rotate(to, from, from + padded);
  // The order is now: the new entry, the old entry, the entries after the old one.
  const auto oldBytes = static_cast<std::size_t>(next - to);
  const std::size_t rest = sizeBefore - static_cast<std::size_t>(next - bytes_.data());
  std::memmove(to + padded, to + padded + oldBytes, rest);
  bytes_.setEnd(to + padded + rest);
  for (std::size_t after = index + 1; after < last; ++after) {
    entries_[after].start += static_cast<std::uint32_t>(padded / 8) -
                             static_cast<std::uint32_t>(oldBytes / 8);  // may wrap around
  }
}

void EncodedDictionary::countLevels() {
  levels_ = 0;
  for (std::size_t index = 0; index < entries_.size(); ++index) {
    levels_ = std::max<unsigned>(levels_, entries_[index].levels);
  }
}

bool EncodedDictionary::remove(std::string_view key) {
  const std::size_t index = find(key, scan(key).hash);
  const std::size_t count = entries_.size();
  if (index == count) return false;
  char* const at = startOf(index);
  if (index + 1 == count) {
    bytes_.setEnd(at - (index == 0 ? 0 : entries_[index - 1].padding));
  } else {
    const char* const next = startOf(index + 1);
    const auto rest = static_cast<std::size_t>(bytes_.data() + bytes_.size() - next);
    const auto shift = static_cast<std::uint32_t>((next - at) / 8);
    std::memmove(at, next, rest);
    bytes_.setEnd(at + rest);
    for (std::size_t after = index + 1; after < count; ++after) {
      entries_[after - 1] = entries_[after];
      entries_[after - 1].start -= shift;
    }
  }
  entries_.removeLast();
  countLevels();
  fillTable();
  return true;
}

bool EncodedDictionary::setNumber(std::string_view key, const WireNumber& number) {
  return setVariant(key, number);
}

bool EncodedDictionary::set(std::string_view key, platform::Date date) {
  return setVariant(key, date);
}

bool EncodedDictionary::set(std::string_view key, std::string_view text) {
  return isWireText(text) && setVariant(key, WireText{text});
}

bool EncodedDictionary::set(std::string_view key, std::span<const std::byte> bytes) {
  return setVariant(key, WireData{bytes});
}

bool EncodedDictionary::set(std::string_view key, const EncodedDictionary& dictionary) {
  // Reserve before using the entries of `dictionary`. It may be this dictionary, and reserving may
  // move its entries.
  reserve(kKeyRoom + key.size() + variantRoom(dictionary.wireForm()));
  return setVariant(key, dictionary.wireForm());
}

bool EncodedDictionary::set(std::string_view key, const EncodedArray& array) {
  return setVariant(key, array.wireForm());
}

std::optional<platform::Dictionary> EncodedDictionary::decode() const {
  std::string body(8 + bytes_.size(), '\0');
  put(body.data(), static_cast<std::uint32_t>(bytes_.size()));
  std::memcpy(body.data() + 8, bytes_.data(), bytes_.size());
  if (bytes_.size() > dbus::kMaxArrayBytes) return std::nullopt;
  dbus::Frame frame;
  frame.header.signature = "a{sv}";
  frame.header.bigEndian = std::endian::native == std::endian::big;
  frame.body = std::as_bytes(std::span(body));
  std::vector<platform::Value> arguments;
  if (dbus::decodeBody(frame, frame.header.signature, arguments)) return std::nullopt;
  return arguments.front().dictionary();
}

}  // namespace halvox::client
