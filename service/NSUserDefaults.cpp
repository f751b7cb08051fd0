#include "service/NSUserDefaults.h"

#include <algorithm>

#include "platform/preferences.h"
#include "platform/services.h"

namespace halvox {
namespace {

// Converts ASCII letters only, because the comparison must not depend on the locale.
constexpr char lower(char letter) {
  return letter >= 'A' && letter <= 'Z' ? static_cast<char>(letter - 'A' + 'a') : letter;
}

bool equalInAnyCase(std::string_view left, std::string_view right) {
  return std::ranges::equal(left, right, {}, lower, lower);
}

}  // namespace

std::optional<platform::Value> NSUserDefaults::objectForKey(std::string_view key) const {
  return platform::preferences().suiteValue(suiteName_, key);
}

std::optional<std::string> NSUserDefaults::stringForKey(std::string_view key) const {
  const auto value = objectForKey(key);
  if (!value.has_value() || !(value->isString() || value->isNumber())) return std::nullopt;
  return platform::describe(*value);
}

bool NSUserDefaults::boolForKey(std::string_view key) const {
  const auto value = objectForKey(key);
  if (!value.has_value()) return false;
  if (value->isNumber()) return value->toBool();
  return equalInAnyCase(value->string(), "yes") || equalInAnyCase(value->string(), "true");
}

}  // namespace halvox
