#include "platform/linux/connection/wire/WireReader.h"

#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/Names.h"
#include "platform/linux/connection/wire/Signature.h"

namespace halvox::platform::linux_::dbus {

bool WireReader::readBoolean(bool& boolean) {
  std::uint32_t number = 0;
  if (!read(number)) return false;
  if (number > 1) return fail("the boolean is neither 0 nor 1");
  boolean = number == 1;
  return true;
}

bool WireReader::readPath(std::string_view& path) {
  if (!readUncheckedText(path)) return false;
  return isObjectPath(path) || fail("the object path is invalid");
}

bool WireReader::readSignature(std::string_view& signature) {
  if (!readVariantSignature(signature)) return false;
  return isSignature(signature) || fail("the signature is invalid");
}

bool WireReader::enterArray(std::size_t elementAlignment, std::size_t& outerLimit) {
  std::uint32_t length = 0;
  if (!read(length)) return false;
  if (length > kMaxArrayBytes) return fail("the array is longer than 64 MiB");
  // Skip the padding even if the array is empty. The length does not include the padding.
  if (!align(elementAlignment)) return false;
  if (length > limit_ - position_) return fail(kEndsTooEarly);
  // Until leaveArray(), reading stops at the end of the array. An element that claims to be longer
  // than its array must not be read from the bytes after the array.
  outerLimit = limit_;
  limit_ = position_ + length;
  return true;
}

std::span<const std::byte> WireReader::takeRest() {
  const std::span rest(reinterpret_cast<const std::byte*>(bytes_ + position_), limit_ - position_);
  position_ = limit_;
  return rest;
}

}  // namespace halvox::platform::linux_::dbus
