#pragma once

#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

#include "client/RequestEncoder.h"
#include "client/SegmentWriter.h"
#include "platform/linux/base/Utf8.h"
#include "platform/linux/connection/wire/Frame.h"
#include "platform/value.h"

// Encodes values as bytes of a request. The code is inline in a header because the caller's thread
// pays for every function call. Only RequestEncoder.cpp includes it.
namespace halvox::client {

// Returns true for ASCII without NUL, which nearly all texts are. Saves them the call of the full
// test, which checks the last bytes one by one.
inline bool isPlainText(std::string_view text) {
  constexpr std::uint64_t kEachByte = 0x0101010101010101;
  constexpr std::uint64_t kEachHighBit = 0x8080808080808080;
  constexpr std::size_t kWord = sizeof(std::uint64_t);
  const auto signs = [&](std::size_t at) {
    std::uint64_t word = 0;
    std::memcpy(&word, text.data() + at, kWord);
    return word | (word - kEachByte);  // subtracting one from a NUL sets its high bit
  };
  if (text.size() < kWord) {
    bool plain = true;
    for (const char character : text) plain &= static_cast<signed char>(character) > 0;
    return plain;
  }
  std::uint64_t all = signs(text.size() - kWord);
  for (std::size_t at = 0; at + kWord <= text.size(); at += kWord) all |= signs(at);
  return (all & kEachHighBit) == 0;
}

inline bool isWireText(std::string_view text) {
  return isPlainText(text) || platform::linux_::isUtf8WithoutNul(text);
}

// Copies a text. Its length is mostly small but seldom a constant, and memcpy() would then be a
// function call.
inline char* copyText(char* to, std::string_view text) {
  const std::size_t size = text.size();
  if (size >= 8 && size <= 32) {
    const char* from = text.data();
    std::memcpy(to, from, 8);
    if (size > 16) {
      std::memcpy(to + 8, from + 8, 8);
      std::memcpy(to + size - 16, from + size - 16, 8);
    }
    std::memcpy(to + size - 8, from + size - 8, 8);
  } else {
    std::memcpy(to, text.data(), size);
  }
  to[size] = '\0';
  return to + size + 1;
}

// Appends zeros up to a multiple of 8 or 4. Always writes 8 bytes, of which the last may lie beyond
// the result.
inline char* padded(char* at, std::size_t alignment) {
  std::memset(at, 0, 8);
  return at + ((0 - reinterpret_cast<std::uintptr_t>(at)) & (alignment - 1));
}

template <typename Number>
inline char* put(char* at, Number number) {
  std::memcpy(at, &number, sizeof number);
  return at + sizeof number;
}

// Appends the signature of one basic type. Also writes a zero after it: four bytes are one store,
// and three would go through the stack.
inline char* putSignature(char* at, char type) {
  const char bytes[4] = {1, type, 0, 0};
  std::memcpy(at, bytes, sizeof bytes);
  return at + 3;
}

template <typename Number>
inline char* putNumber(char* at, char type, Number number) {
  at = putSignature(at, type);
  return put(padded(at, sizeof number), number);
}

inline char* putNumber(char* at, const Value& value) {
  switch (value.numberKind()) {
    case platform::NumberKind::kBool:
      return putNumber(at, 'b', static_cast<std::uint32_t>(value.toBool()));
    case platform::NumberKind::kUInt8:
      return put(putSignature(at, 'y'), static_cast<std::uint8_t>(value.toUInt64()));
    case platform::NumberKind::kInt16:
      return putNumber(at, 'n', static_cast<std::int16_t>(value.toInt64()));
    case platform::NumberKind::kUInt16:
      return putNumber(at, 'q', static_cast<std::uint16_t>(value.toUInt64()));
    case platform::NumberKind::kInt32:
      return putNumber(at, 'i', static_cast<std::int32_t>(value.toInt64()));
    case platform::NumberKind::kUInt32:
      return putNumber(at, 'u', static_cast<std::uint32_t>(value.toUInt64()));
    case platform::NumberKind::kInt64:
      return putNumber(at, 'x', value.toInt64());
    case platform::NumberKind::kUInt64:
      return putNumber(at, 't', value.toUInt64());
    case platform::NumberKind::kFloat:
    case platform::NumberKind::kDouble:
      return putNumber(at, 'd', value.toDouble());
  }
  return at;
}

// Signature, padding and number need at most this much, including what padded() writes.
constexpr std::size_t kNumberRoom = 24;
// The room that an entry needs in addition to its texts: padding, two lengths, two NULs and a
// signature.
constexpr std::size_t kEntryRoom = 16 + kNumberRoom;

// Appends values and remembers why one cannot be sent. If `path` is not null, stores the place of
// that value in the message there.
class ValueWriter {
 public:
  explicit ValueWriter(SegmentWriter& writer, std::string* path = nullptr)
      : writer_(writer), path_(path) {}

  bool append(const Dictionary& dictionary) {
    if (!enter()) return false;
    char* const length = writer_.length();
    writer_.align(8);
    const std::size_t start = writer_.position();
    for (const auto& [key, value] : dictionary) {
      if (!appendEntry(key.text(), value)) {
        notePlace(std::string_view(key.text()));
        return false;
      }
    }
    return leaveArray(length, start);
  }

  [[nodiscard]] std::string error() const {
    return path_ == nullptr || path_->empty() ? reason_ : "\"" + *path_ + "\": " + reason_;
  }

 private:
  bool fail(const char* reason) {
    reason_ = reason;
    return false;
  }
  bool enter(unsigned levels = 1) {
    depth_ += levels;
    return depth_ <= platform::linux_::dbus::kMaxNesting || fail("nested too deep");
  }
  bool leave(unsigned levels = 1) {
    depth_ -= levels;
    return true;
  }
  bool leaveArray(char* length, std::size_t start) {
    const std::size_t bytes = writer_.position() - start;
    if (bytes > platform::linux_::dbus::kMaxArrayBytes)
      return fail("longer than 64 MiB, the limit of D-Bus");
    SegmentWriter::replaceLength(length, bytes);
    return leave();
  }
  // When no room remains, writing the rest of a large message would only take time.
  [[nodiscard]] bool mayGoOn() const { return !writer_.isFull(); }

  void notePlace(std::string_view key) {
    if (path_ == nullptr) return;
    const bool joined = path_->empty() || path_->front() == '[';
    path_->insert(0, std::string(key) + (joined ? "" : "."));
  }
  void notePlace(std::size_t index) {
    if (path_ == nullptr) return;
    const bool joined = path_->empty() || path_->front() == '[';
    path_->insert(0, "[" + std::to_string(index) + "]" + (joined ? "" : "."));
  }

  bool appendEntry(std::string_view key, const Value& value) {
    if (!isWireText(key)) return fail("the key is not UTF-8 without NUL");
    // The fast path: nearly all values are numbers and short texts, and their entries fit into the
    // current segment.
    const std::string_view text = value.string();
    char* at = writer_.reserve(key.size() + text.size() + kEntryRoom);
    if (at != nullptr && depth_ < platform::linux_::dbus::kMaxNesting) {
      if (value.isNumber()) {
        writer_.commit(putNumber(putKey(at, key), value));
        return true;
      }
      if (value.isString()) {
        if (!isText(text)) return false;
        at = putSignature(putKey(at, key), 's');
        at = put(padded(at, 4), static_cast<std::uint32_t>(text.size()));
        writer_.commit(copyText(at, text));
        return true;
      }
    }
    writer_.align(8);
    writeText(key);
    return mayGoOn() && appendVariant(value);
  }

  static char* putKey(char* at, std::string_view key) {
    return copyText(put(padded(at, 8), static_cast<std::uint32_t>(key.size())), key);
  }

  bool isText(std::string_view text) {
    return isWireText(text) || fail("the text is not UTF-8 without NUL");
  }
  void writeText(std::string_view text) {
    writer_.number(static_cast<std::uint32_t>(text.size()));
    writer_.bytes(text.data(), text.size());
    writer_.bytes("", 1);
  }
  void writeSignature(std::string_view signature) {
    writer_.number(static_cast<std::uint8_t>(signature.size()));
    writer_.bytes(signature.data(), signature.size());
    writer_.bytes("", 1);
  }

  bool appendVariant(const Value& value) {
    switch (value.kind()) {
      case platform::ValueKind::kNone:
        return fail("there is no value");
      case platform::ValueKind::kNumber:
        return appendNumber(value);
      case platform::ValueKind::kString:
        return appendString(value.string());
      case platform::ValueKind::kDate:
        return appendDate(value.date());
      case platform::ValueKind::kData:
        return appendData(value.data());
      case platform::ValueKind::kArray:
        return appendArray(value.array());
      case platform::ValueKind::kDictionary:
        writeSignature("a{sv}");
        return enter() && append(value.dictionary()) && leave();
    }
    return fail("a value of an unknown kind");
  }

  bool appendNumber(const Value& value) {
    if (!enter()) return false;
    // The padding depends on where the value begins. Encode it here at the same offset from a
    // multiple of 8.
    alignas(8) std::array<char, 8 + kNumberRoom> made{};
    const std::size_t misaligned = writer_.position() % 8;
    const char* const end = putNumber(made.data() + misaligned, value);
    writer_.bytes(made.data() + misaligned,
                  static_cast<std::size_t>(end - made.data()) - misaligned);
    return leave();
  }

  bool appendString(std::string_view text) {
    if (!enter()) return false;
    if (!isText(text)) return false;
    if (text.size() > platform::linux_::dbus::kMaxMessageBytes)
      return fail("longer than a message can be");
    writeSignature("s");
    writeText(text);
    return leave();
  }

  bool appendDate(platform::Date date) {
    if (!enter(2)) return false;
    writeSignature("(d)");
    writer_.align(8);
    writer_.number(date.secondsSince1970);
    return leave(2);
  }

  bool appendData(const platform::Data& data) {
    if (!enter(2)) return false;
    const auto bytes = data.bytes();
    if (bytes.size() > platform::linux_::dbus::kMaxArrayBytes)
      return fail("longer than 64 MiB, the limit of D-Bus");
    writeSignature("ay");
    writer_.number(static_cast<std::uint32_t>(bytes.size()));
    writer_.bytes(bytes.data(), bytes.size());
    return leave(2);
  }

  bool appendArray(const platform::Array& array) {
    if (!enter(2)) return false;
    writeSignature("av");
    char* const length = writer_.length();
    const std::size_t start = writer_.position();
    for (std::size_t index = 0; index < array.size(); ++index) {
      if (mayGoOn() && appendVariant(array[index])) continue;
      notePlace(index);
      return false;
    }
    return leaveArray(length, start) && leave();
  }

  SegmentWriter& writer_;
  unsigned depth_ = 0;
  const char* reason_ = "";
  std::string* path_;  // owned by the caller; null if not wanted
};

}  // namespace halvox::client
