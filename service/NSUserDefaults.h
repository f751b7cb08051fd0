#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/value.h"

namespace halvox {

// Reads the settings of one named suite, each as the type that the caller wants.
// Keeps only the name: every call reads the settings store again. Any thread may call.
class NSUserDefaults {
 public:
  explicit NSUserDefaults(std::string_view suiteName) : suiteName_(suiteName) {}

  // The stored value, or none.
  [[nodiscard]] std::optional<platform::Value> objectForKey(std::string_view key) const;
  // A string unchanged, or the text of a number; none for any other value.
  [[nodiscard]] std::optional<std::string> stringForKey(std::string_view key) const;
  // True for a number other than 0, and for the strings "YES" and "true" in any letter case.
  [[nodiscard]] bool boolForKey(std::string_view key) const;

 private:
  const std::string suiteName_;
};

}  // namespace halvox
