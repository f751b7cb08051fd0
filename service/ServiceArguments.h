#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace halvox {

// What the command line asks of the service. It has no settings: they are all in the configuration
// file.
struct ServiceArguments {
  enum class Request : std::uint8_t { kServe, kShowHelp, kShowVersion, kMistake };
  Request request = Request::kServe;
  std::string mistake{};  // with kMistake, one line for the user
};

// Parses the arguments after the program's name. Of several requests the first counts, unless any
// argument is a mistake.
[[nodiscard]] ServiceArguments parseServiceArguments(std::span<const char* const> arguments);

// Returns the help. It names `configurationFile`, which the service would read now.
[[nodiscard]] std::string serviceHelp(std::string_view configurationFile);

}  // namespace halvox
