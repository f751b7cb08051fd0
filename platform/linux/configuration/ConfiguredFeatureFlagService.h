#pragma once

#include <string_view>
#include <utility>

#include "platform/feature_flags.h"
#include "platform/linux/configuration/Configuration.h"

namespace halvox::platform::linux_ {

// The feature switches that the configuration file sets. Immutable. Any thread may use it. Owned by
// the platform.
class ConfiguredFeatureFlagService final : public FeatureFlagService {
 public:
  explicit ConfiguredFeatureFlagService(FeatureSwitches switches)
      : switches_(std::move(switches)) {}

  [[nodiscard]] bool _os_feature_enabled_impl(std::string_view domain,
                                              std::string_view feature) const override;

 private:
  const FeatureSwitches switches_;
};

}  // namespace halvox::platform::linux_
