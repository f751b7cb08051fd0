#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

// The grammar of types on the wire.
namespace halvox::platform::linux_::dbus {

inline constexpr std::size_t kMaxSignatureBytes = 255;
// Arrays in arrays, and structs or dictionary entries in such, within one signature.
inline constexpr unsigned kMaxSignatureNesting = 32;

enum class SignatureShape : std::uint8_t {
  kTaken,        // every type in it has a form as a value
  kUnsupported,  // sound, but we have no form for a type in it
  kTooDeep,      // sound but for its nesting
  kBroken,       // against the grammar
};

// What any number of complete types amount to.
[[nodiscard]] SignatureShape shapeOfSignature(std::string_view signature);
// The same for exactly one complete type, as variants have it.
[[nodiscard]] SignatureShape shapeOfType(std::string_view type);

// True when a message or a value may carry this signature, whether or not we have a form for it.
[[nodiscard]] bool isSignature(std::string_view signature);

// The length of the first complete type of a sound signature that is not empty.
[[nodiscard]] std::size_t firstTypeLength(std::string_view signature);

// The boundary at which values of the type with that first character stand; 1 for an unknown one.
[[nodiscard]] std::size_t alignmentOf(char typeCode);

}  // namespace halvox::platform::linux_::dbus
