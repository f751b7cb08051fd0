#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace halvox {

// What the service's command line asks for. All settings are in the configuration file, so there is
// little to ask.
struct ServiceArguments {
  enum class Request : std::uint8_t { kServe, kShowHelp, kShowVersion, kMistake };
  Request request = Request::kServe;
  std::string mistake{};  // one line for the user, when there is one
};

// `arguments` are those after the program's name.
[[nodiscard]] ServiceArguments parseServiceArguments(std::span<const char* const> arguments);

// The help. It names `configurationFile`, where the service would read its settings now.
[[nodiscard]] std::string serviceHelp(std::string_view configurationFile);

}  // namespace halvox
