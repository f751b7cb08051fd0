#pragma once

#include <span>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// A part that a build may lack, because of an option of CMake.
struct OptionalPart {
  std::string_view name;
  std::string_view option;  // such as "HALVOX_NATS"
  bool isBuilt = false;
};

// Returns what `--version` prints: one line with the program, its version and the commit, unless
// that is empty, then a line with the parts that are built and one with those that are not. The
// last line has no end.
[[nodiscard]] std::string versionText(std::string_view program, std::string_view commit,
                                      std::span<const OptionalPart> parts);

// The optional parts of the service.
[[nodiscard]] std::span<const OptionalPart> serviceParts();

}  // namespace halvox::platform::linux_
