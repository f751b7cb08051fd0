#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// The largest property list that is read. Real lists are far smaller; the bounds keep a hostile one
// from taking the service's memory or stack.
struct PropertyListBounds {
  std::size_t depth = 64;            // levels of containers
  std::uint64_t elements = 500'000;  // values and keys; a shared one counts for each use
  std::uint64_t bytes = 32U << 20U;  // of texts and data; a shared one counts for each use
};

// Returns why these bytes must not be passed to libplist; none if they are within the bounds. Bytes
// within the bounds may still not be a property list: the library finds that out.
//
// The check comes first because the library cannot be stopped. It recurses for each level until the
// stack ends. It copies each value that a binary list uses twice, which can make any number of
// values from a few bytes. It ends the process by an assertion at a key with a NUL.
//
// Allocates a few bytes for each object of a binary list. Any thread may call.
[[nodiscard]] std::optional<std::string> whyUnreadable(std::string_view bytes,
                                                       const PropertyListBounds& bounds);

// True for the binary form. Everything else is treated as XML.
[[nodiscard]] bool isBinaryPropertyList(std::string_view bytes);

}  // namespace halvox::platform::linux_
