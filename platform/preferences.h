#pragma once

#include <optional>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// The settings store: values by key in domains of users. Read afresh at every call; a domain that
// does not exist, cannot be read or has no such key gives none. Any thread may call; reads a file.
class PreferenceService {
 public:
  virtual ~PreferenceService() = default;

  // The value of a key in the domain of that application for that user, on any host.
  [[nodiscard]] virtual std::optional<Value> CFPreferencesCopyValue(
      std::string_view key, std::string_view applicationID, std::string_view userName) const = 0;
  // The value of a key in a named suite of the user that the service runs for.
  [[nodiscard]] virtual std::optional<Value> suiteValue(std::string_view suiteName,
                                                        std::string_view key) const = 0;
};

}  // namespace halvox::platform
