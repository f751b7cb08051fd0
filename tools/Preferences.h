#pragma once

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>

#include "tools/Command.h"

namespace halvox::tools {

// A request to show or change settings that the service follows while it runs.
struct Preferences {
  enum class Action : std::uint8_t { kGet, kSet, kUnset };
  Action action = Action::kGet;
  std::string domain{};
  std::optional<std::string> key{};    // none: get shows all keys
  std::optional<std::string> value{};  // only for set
  bool isString = false;               // take the value as a string, whatever it looks like
  std::string user = "mobile";
  std::string directory{};  // empty: as the service's configuration says
};

// Shows or changes settings in their files. The service need not run; if it runs, it notices the
// change. Returns kRefused if a key to get or unset does not exist.
ExitStatus showOrChangePreferences(const Preferences& request, bool json, std::ostream& out,
                                   std::ostream& errors);

}  // namespace halvox::tools
