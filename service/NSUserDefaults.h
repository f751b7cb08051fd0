#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/value.h"

namespace halvox {

// The settings of one named suite, each read as the type that the caller wants.
// Holds nothing but the name: every call asks the settings store anew. Any thread may call.
class NSUserDefaults {
 public:
  explicit NSUserDefaults(std::string_view suiteName) : suiteName_(suiteName) {}

  // The value as it is stored, or none.
  [[nodiscard]] std::optional<platform::Value> objectForKey(std::string_view key) const;
  // A string as it stands and a number as its text; none for anything else.
  [[nodiscard]] std::optional<std::string> stringForKey(std::string_view key) const;
  // True for a number that is not 0 and for the strings "YES" and "true" in any case of letters.
  [[nodiscard]] bool boolForKey(std::string_view key) const;

 private:
  const std::string suiteName_;
};

}  // namespace halvox
