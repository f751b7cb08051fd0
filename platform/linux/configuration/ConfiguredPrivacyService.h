#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/configuration/Configuration.h"
#include "platform/privacy.h"

namespace halvox::platform::linux_ {

// The privacy rules that the configuration file sets. Immutable. Any thread may use it. Owned by
// the platform.
class ConfiguredPrivacyService final : public PrivacyService {
 public:
  explicit ConfiguredPrivacyService(Configuration::Privacy rules);

  // A key also matches in the form in which it is stored, which has `_` instead of blanks.
  [[nodiscard]] bool dropsKey(std::string_view key) const override;

 private:
  const std::vector<std::string> dropKeys_;  // patterns for fnmatch(3)
};

}  // namespace halvox::platform::linux_
