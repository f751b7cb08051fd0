#include "platform/linux/connection/wire/ValueSkipper.h"

#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/Signature.h"

namespace halvox::platform::linux_::dbus {
namespace {

// kMaxNesting bounds the recursion. The length of the signature would not bound it, because each
// variant can contain another variant.
bool skip(WireReader& reader, std::string_view type, unsigned level);

template <typename Number>
bool skipNumber(WireReader& reader) {
  Number number{};
  return reader.read(number);
}

// Skips the members of a struct or of a dictionary entry.
bool skipMembers(WireReader& reader, std::string_view types, unsigned level) {
  if (!reader.align(8)) return false;
  while (!types.empty()) {
    const std::size_t length = firstTypeLength(types);
    if (!skip(reader, types.substr(0, length), level)) return false;
    types.remove_prefix(length);
  }
  return true;
}

bool skipArray(WireReader& reader, std::string_view element, unsigned level) {
  std::size_t outerLimit = 0;
  if (!reader.enterArray(alignmentOf(element.front()), outerLimit)) return false;
  while (!reader.atLimit()) {
    // A dictionary entry, unlike a struct, is not a level of its own.
    const bool sound = element.front() == '{'
                           ? skipMembers(reader, element.substr(1, element.size() - 2), level)
                           : skip(reader, element, level);
    if (!sound) return false;
  }
  reader.leaveArray(outerLimit);
  return true;
}

bool skipVariant(WireReader& reader, unsigned level) {
  std::string_view type;
  if (!reader.readVariantSignature(type)) return false;
  const SignatureShape shape = shapeOfType(type);
  if (shape == SignatureShape::kBroken || shape == SignatureShape::kTooDeep) {
    return reader.fail("the signature of a variant is invalid");
  }
  return skip(reader, type, level);
}

bool skipContainer(WireReader& reader, std::string_view type, unsigned level) {
  if (level > kMaxNesting) return reader.fail("containers are nested more than 64 levels deep");
  if (type.front() == 'v') return skipVariant(reader, level);
  if (type.front() == 'a') return skipArray(reader, type.substr(1), level);
  return skipMembers(reader, type.substr(1, type.size() - 2), level);
}

// `level` is the number of containers around the value.
bool skip(WireReader& reader, std::string_view type, unsigned level) {
  bool boolean = false;
  std::string_view text;
  switch (type.front()) {
    case 'y':
      return skipNumber<std::uint8_t>(reader);
    case 'n':
    case 'q':
      return skipNumber<std::uint16_t>(reader);
    case 'i':
    case 'u':
    case 'h':
      return skipNumber<std::uint32_t>(reader);
    case 'x':
    case 't':
    case 'd':
      return skipNumber<std::uint64_t>(reader);
    case 'b':
      return reader.readBoolean(boolean);
    case 's':
      return reader.readText(text);
    case 'o':
      return reader.readPath(text);
    case 'g':
      return reader.readSignature(text);
    default:  // a, v or (
      return skipContainer(reader, type, level + 1);
  }
}

}  // namespace

bool skipValue(WireReader& reader, std::string_view type) { return skip(reader, type, 0); }

}  // namespace halvox::platform::linux_::dbus
