#include "platform/linux/configuration/ConfiguredPrivacyService.h"

#include <algorithm>
#include <utility>

#include <fnmatch.h>

namespace halvox::platform::linux_ {
namespace {

bool matchesAny(const std::vector<std::string>& patterns, const std::string& key) {
  return std::ranges::any_of(patterns, [&key](const std::string& pattern) {
    return ::fnmatch(pattern.c_str(), key.c_str(), FNM_NOESCAPE) == 0;
  });
}

}  // namespace

ConfiguredPrivacyService::ConfiguredPrivacyService(Configuration::Privacy rules)
    : PrivacyService(rules.dropKeys.empty() ? KeyRules::kNone : KeyRules::kSome),
      dropKeys_(std::move(rules.dropKeys)) {}

bool ConfiguredPrivacyService::dropsKey(std::string_view key) const {
  std::string text(key);
  if (matchesAny(dropKeys_, text)) return true;
  if (text.find(' ') == std::string::npos) return false;
  std::ranges::replace(text, ' ', '_');
  return matchesAny(dropKeys_, text);
}

}  // namespace halvox::platform::linux_
