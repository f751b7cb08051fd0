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

// A message that can be encoded as protocol buffers. A plain value, used by one thread at a time.
class ProtoBase {
 public:
  virtual ~ProtoBase() = default;

  // Reads fields until the end. Returns false after an error; the fields before it have been read.
  [[nodiscard]] virtual bool readFrom(ProtoReader& reader) = 0;
  virtual void writeTo(ProtoWriter& writer) const = 0;
  virtual void formatText(ProtoTextFormatter& formatter, const char* name) const = 0;

 protected:
  ProtoBase() = default;
  ProtoBase(const ProtoBase&) = default;
  ProtoBase& operator=(const ProtoBase&) = default;
};

// How the value of a field is encoded: the low three bits of its tag. The bytes may also contain 6
// and 7, which have no meaning; the reader treats them as errors.
enum class ProtoWireType : std::uint8_t {
  kVarint = 0,
  kFixed64 = 1,
  kLengthDelimited = 2,
  kStartGroup = 3,
  kEndGroup = 4,
  kFixed32 = 5,
};

// A cursor over encoded bytes. The caller owns the bytes, which must outlive the reader. Used by
// one thread.
//
// The bytes are not trusted. Reading past the end sets the error flag, which stays set; nothing
// beyond the bytes is ever read.
class ProtoReader {
 public:
  // The field number has 64 bits, although valid ones fit into 29, because malformed bytes may
  // contain any number.
  struct Tag {
    std::uint64_t number;
    ProtoWireType wireType;
  };

  explicit ProtoReader(std::span<const std::byte> bytes) : bytes_(bytes) {}

  [[nodiscard]] std::size_t position() const { return position_; }
  [[nodiscard]] std::size_t end() const { return bytes_.size(); }
  [[nodiscard]] bool hasError() const { return error_; }
  // True until the end is reached or a read has failed.
  [[nodiscard]] bool hasMore() const { return position_ < end() && !error_; }

  // The varint at the position. A varint that the end cuts off sets the error flag and reads as 0.
  // A varint of more than ten bytes, which no 64-bit number needs, reads as 0 without an error, and
  // decoding continues after the ten bytes. This difference is required.
  [[nodiscard]] std::uint64_t readVarint();
  [[nodiscard]] Tag readTag();
  // Copies the string at the position to `value`. If the string is longer than the remaining bytes,
  // sets the error flag and leaves `value` unchanged.
  void readString(std::string& value);
  // Skips the value of a field whose tag was read, and a group to its end. Returns false and sets
  // the error flag if the bytes end before the value, if no value has this wire type, if a group
  // ends with the number of another group, or if groups are nested more than 100 deep. The depth is
  // bounded because skipping recurses.
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

// Appends fields to a buffer that it owns, in the order of the calls. Used by one thread.
class ProtoWriter {
 public:
  void writeUInt64(std::uint64_t value, std::uint32_t number);
  // A negative value takes ten bytes, because the format extends it to 64 bits.
  void writeInt32(std::int32_t value, std::uint32_t number);
  void writeString(std::string_view value, std::uint32_t number);

  // The bytes written so far; valid until the next write.
  [[nodiscard]] std::span<const std::byte> bytes() const { return bytes_; }

 private:
  void writeTag(std::uint32_t number, ProtoWireType wireType);
  void writeVarint(std::uint64_t value);

  std::vector<std::byte> bytes_;
};

// Formats messages as text for people, one value a line, with objects in braces:
//
//   report {
//     duration: 12
//     node: "mixer"
//   }
//
// Strings are quoted, and everything in them that is not printable ASCII is escaped. Used by one
// thread.
class ProtoTextFormatter {
 public:
  // A null name begins an object without a name. Each object that is begun must be ended.
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
