#pragma once

#include <string_view>

namespace halvox::platform {

// Switches for features that are not for everybody. Any thread may ask; nothing blocks.
class FeatureFlagService {
 public:
  virtual ~FeatureFlagService() = default;

  // Whether the feature of that domain and name is on; an unknown one is off.
  [[nodiscard]] virtual bool _os_feature_enabled_impl(std::string_view domain,
                                                      std::string_view feature) const = 0;
};

}  // namespace halvox::platform
