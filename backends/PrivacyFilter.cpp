#include "backends/PrivacyFilter.h"

#include <vector>

#include "platform/services.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::PrivacyService;
using platform::Value;

Value filtered(const PrivacyService& rules, const Value& value);

// The recursion is bounded, because the connection refuses messages that are nested deeper than the
// wire allows.
Dictionary filtered(const PrivacyService& rules, const Dictionary& dictionary) {
  Dictionary result;
  result.reserve(dictionary.size());
  for (const auto& [key, value] : dictionary) {
    if (!rules.dropsKey(key.text())) result.add(key, filtered(rules, value));
  }
  return result;
}

Value filtered(const PrivacyService& rules, const Array& array) {
  std::vector<Value> values;
  values.reserve(array.size());
  for (const Value& value : array) values.push_back(filtered(rules, value));
  return Array(values);
}

Value filtered(const PrivacyService& rules, const Value& value) {
  if (value.isDictionary()) return filtered(rules, value.dictionary());
  if (value.isArray()) return filtered(rules, value.array());
  return value;
}

}  // namespace

void dropKeys(Dictionary& dictionary) {
  const PrivacyService& rules = platform::privacy();
  if (rules.hasKeyRules()) dictionary = filtered(rules, dictionary);
}

bool isKeyDropped(std::string_view key) { return platform::privacy().dropsKey(key); }

}  // namespace halvox
