#pragma once

#include <cstdint>
#include <string_view>

namespace halvox {

// Returns the 64-bit hash of a text's bytes: CityHash64 as libc++ implements std::hash<std::string>
// on 64-bit machines. Hashes made here must equal hashes made by programs that use libc++. Other
// standard libraries have other hashes, and the published CityHash64 differs too, so this
// implements it again.
// Pure; any thread may call. Not for hash tables that a client can fill: it has no secret seed.
std::uint64_t hashString(std::string_view text);

}  // namespace halvox
