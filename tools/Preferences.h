#pragma once

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>

#include "tools/Command.h"

namespace halvox::tools {

// Settings that the service follows while it runs.
struct Preferences {
  enum class Action : std::uint8_t { kGet, kSet, kUnset };
  Action action = Action::kGet;
  std::string domain{};
  std::optional<std::string> key{};    // none: all, to get
  std::optional<std::string> value{};  // to set
  bool isString = false;               // whatever the value looks like
  std::string user = "mobile";
  std::string directory{};  // empty: where the service's configuration puts it
};

// Shows or changes settings that the service follows while it runs. Works on the files, so it does
// not need the service to run. What there is nothing of (to get or to unset) is kRefused.
ExitStatus showOrChangePreferences(const Preferences& request, bool json, std::ostream& out,
                                   std::ostream& errors);

}  // namespace halvox::tools
