#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// How large a property list may become when it is read.
struct PropertyListBounds {
  std::size_t depth = 64;            // levels of containers
  std::uint64_t elements = 500'000;  // values and keys, shared ones as often as they are used
  std::uint64_t bytes = 32U << 20U;  // of texts and data, shared ones likewise
};

// Why these bytes must not be given to the library that reads property lists: it goes one step down
// its stack for each level, and makes a copy of each value that a binary list uses twice, so that
// few bytes could become any number of values. None when they are within the bounds; they may still
// be no property list. Allocates a few bytes for each object of a binary list.
[[nodiscard]] std::optional<std::string> whyUnreadable(std::string_view bytes,
                                                       const PropertyListBounds& bounds);

// True for the binary form; everything else is taken for XML.
[[nodiscard]] bool isBinaryPropertyList(std::string_view bytes);

}  // namespace halvox::platform::linux_
