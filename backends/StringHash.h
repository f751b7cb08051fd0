#pragma once

#include <cstdint>
#include <string_view>

namespace halvox {

// Returns the 64-bit hash of a text's bytes: CityHash64 as libc++ implements std::hash<std::string>
// on 64-bit machines. Programs that use libc++ must find the same hashes. std::hash of another
// standard library gives different ones, and so does the published CityHash64.
//
// Pure; any thread may call. Not for hash tables that a client can fill: it has no secret seed.
std::uint64_t hashString(std::string_view text);

}  // namespace halvox
