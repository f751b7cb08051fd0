#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <string_view>

#include "client/RequestEncoder.h"
#include "client/SegmentWriter.h"
#include "client/WireParts.h"
#include "platform/linux/connection/wire/Frame.h"
#include "platform/value.h"

// Encodes values as bytes of a request. The code is inline in a header because every function call
// costs time on the caller's thread. Only RequestEncoder.cpp includes this header.
namespace halvox::client {

// Appends values. If a value cannot be sent, remembers the reason, and stores the place of the
// value in the message in `path` unless that is null.
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
  // Stop when no memory remains. Writing the rest of a large message would only take time.
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
    // This is the fast path. Nearly all values are numbers and short texts, and their entries fit
    // into the current segment.
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
    // The padding depends on where the value begins. Encode the value at the same offset from a
    // multiple of 8 as its place in the message.
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
