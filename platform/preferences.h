#pragma once

#include <optional>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// The settings store: values by key, in domains of users.
//
// Every call reads the store again. No change can therefore be missed, and there is no cache to
// invalidate. A domain that does not exist, a file that cannot be read and a missing key all have
// the same result: no value.
//
// Any thread may call; a call reads a file. The composition root owns the service.
class PreferenceService {
 public:
  virtual ~PreferenceService() = default;

  // The value of a key in the domain of an application for a user, on any host. The spelling is
  // part of the interface.
  [[nodiscard]] virtual std::optional<Value> CFPreferencesCopyValue(
      std::string_view key, std::string_view applicationID, std::string_view userName) const = 0;
  // The value of a key in a named suite of the user that the service runs for.
  [[nodiscard]] virtual std::optional<Value> suiteValue(std::string_view suiteName,
                                                        std::string_view key) const = 0;
};

}  // namespace halvox::platform
