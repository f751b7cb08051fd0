#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

namespace halvox {

// Makes the texts whose hashes are in string_hashes.txt, one a line: arbitrary bytes, with lengths
// from 0 to 300 in turn. The texts are the same on every machine.
inline constexpr std::size_t kHashedStrings = 10'000;

inline std::string hashedString(std::size_t index) {
  constexpr std::size_t kLengths = 301;
  std::uint64_t state = index;
  std::string text(index % kLengths, '\0');
  for (char& character : text) {
    // One step of the SplitMix64 generator.
    state += 0x9e3779b97f4a7c15U;
    std::uint64_t mixed = (state ^ (state >> 30)) * 0xbf58476d1ce4e5b9U;
    mixed = (mixed ^ (mixed >> 27)) * 0x94d049bb133111ebU;
    character = static_cast<char>(mixed >> 56);
  }
  return text;
}

}  // namespace halvox
