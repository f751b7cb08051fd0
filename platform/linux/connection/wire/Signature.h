#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

// The grammar of D-Bus type signatures.
namespace halvox::platform::linux_::dbus {

inline constexpr std::size_t kMaxSignatureBytes = 255;
// How deeply arrays may be nested within one signature. The same limit applies to structs and
// dictionary entries, which are counted together but separately from arrays.
inline constexpr unsigned kMaxSignatureNesting = 32;

enum class SignatureShape : std::uint8_t {
  kTaken,        // valid, and all its types are supported
  kUnsupported,  // valid, but one of its types is not supported
  kTooDeep,      // valid apart from its nesting
  kBroken,       // against the grammar
};

// Returns the shape of a signature with any number of complete types.
[[nodiscard]] SignatureShape shapeOfSignature(std::string_view signature);
// Returns the shape of a signature with exactly one complete type, as a variant must have.
[[nodiscard]] SignatureShape shapeOfType(std::string_view type);

// Returns true for a valid signature, whether or not its types are supported.
[[nodiscard]] bool isSignature(std::string_view signature);

// Returns the length of the first complete type. The signature must be valid and not empty.
[[nodiscard]] std::size_t firstTypeLength(std::string_view signature);

// Returns the alignment of a type, which depends on its first character; 1 for an unknown
// character.
[[nodiscard]] std::size_t alignmentOf(char typeCode);

}  // namespace halvox::platform::linux_::dbus
