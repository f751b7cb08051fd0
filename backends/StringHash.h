#pragma once

#include <cstdint>
#include <string_view>

namespace halvox {

// The 64-bit hash of a text's bytes: CityHash64 in the edition that libc++ has as the hash of
// std::string on 64-bit machines. It differs from the published ones, and from what this standard
// library has, so it is written here: hashes are compared with those that others made.
// Not for hash tables that a client can fill: it has no secret.
std::uint64_t hashString(std::string_view text);

}  // namespace halvox
