#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::platform {

class ProtoReader;
class ProtoWriter;
class ProtoTextFormatter;

// A message with a protocol-buffers form.
class ProtoBase {
 public:
  virtual ~ProtoBase() = default;

  // Reads fields until the end; false after an error, with the fields before it read.
  [[nodiscard]] virtual bool readFrom(ProtoReader& reader) = 0;
  virtual void writeTo(ProtoWriter& writer) const = 0;
  virtual void formatText(ProtoTextFormatter& formatter, const char* name) const = 0;

 protected:
  ProtoBase() = default;
  ProtoBase(const ProtoBase&) = default;
  ProtoBase& operator=(const ProtoBase&) = default;
};

// How a field's value is laid out, in the low three bits of its tag. Any number may come in.
enum class ProtoWireType : std::uint8_t {
  kVarint = 0,
  kFixed64 = 1,
  kLengthDelimited = 2,
  kStartGroup = 3,
  kEndGroup = 4,
  kFixed32 = 5,
};

// A cursor over encoded bytes, which it does not own and which must outlive it. One thread.
// Reading past the end sets the error flag, which stays set; nothing is ever read beyond the bytes.
class ProtoReader {
 public:
  // The number is wider than any legal one, because it is what the bytes say.
  struct Tag {
    std::uint64_t number;
    ProtoWireType wireType;
  };

  explicit ProtoReader(std::span<const std::byte> bytes) : bytes_(bytes) {}

  [[nodiscard]] std::size_t position() const { return position_; }
  [[nodiscard]] std::size_t end() const { return bytes_.size(); }
  [[nodiscard]] bool hasError() const { return error_; }
  // Whether there is more to read: the end is not reached and nothing has failed.
  [[nodiscard]] bool hasMore() const { return position_ < end() && !error_; }

  // The varint at the position. One that goes on after ten bytes reads as 0, without an error; one
  // that is cut off by the end sets the error flag and reads as 0.
  [[nodiscard]] std::uint64_t readVarint();
  [[nodiscard]] Tag readTag();
  // The string at the position, copied over `value`. Sets the error flag, and leaves `value` alone,
  // when it is longer than what is left.
  void readString(std::string& value);
  // Goes past the value of a field whose tag was read; a group is skipped to its end. False, and
  // the error flag, when the value is cut off, its wire type is none that has a value, or groups
  // are not closed by their own number or are nested more than 100 deep.
  [[nodiscard]] bool skipField(std::uint64_t number, ProtoWireType wireType);

 private:
  [[nodiscard]] bool fail();
  [[nodiscard]] bool skipBytes(std::uint64_t count);
  [[nodiscard]] bool skipValue(std::uint64_t number, ProtoWireType wireType, unsigned depth);
  [[nodiscard]] bool skipGroup(std::uint64_t number, unsigned depth);

  std::span<const std::byte> bytes_;
  std::size_t position_ = 0;
  bool error_ = false;
};

// Appends fields to a buffer of its own. One thread.
class ProtoWriter {
 public:
  void writeUInt64(std::uint64_t value, std::uint32_t number);
  // A negative value takes ten bytes: it is written as its extension to 64 bits.
  void writeInt32(std::int32_t value, std::uint32_t number);
  void writeString(std::string_view value, std::uint32_t number);

  // What was written so far; valid until the next write.
  [[nodiscard]] std::span<const std::byte> bytes() const { return bytes_; }

 private:
  void writeTag(std::uint32_t number, ProtoWireType wireType);
  void writeVarint(std::uint64_t value);

  std::vector<std::byte> bytes_;
};

// Makes the text of messages as people read it, one value a line, objects in braces:
//
//   report {
//     duration: 12
//     node: "mixer"
//   }
//
// Strings are quoted; what is not printable ASCII in them is escaped. One thread.
class ProtoTextFormatter {
 public:
  // A null name gives an object without one. Every object that is begun is ended.
  void beginObject(const char* name);
  void format(const char* name, std::int32_t value);
  void format(const char* name, std::uint64_t value);
  void format(const char* name, std::string_view value);
  void endObject();

  [[nodiscard]] const std::string& text() const { return text_; }

 private:
  void beginLine();

  std::string text_;
  std::size_t depth_ = 0;
};

}  // namespace halvox::platform
