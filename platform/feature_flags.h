#pragma once

#include <string_view>

namespace halvox::platform {

// Switches for features that are not enabled everywhere. The configuration sets them.
//
// Any thread may call; nothing blocks, and nothing fails. The composition root owns the service.
class FeatureFlagService {
 public:
  virtual ~FeatureFlagService() = default;

  // Whether the feature of that domain and name is enabled. An unknown feature is disabled. The
  // spelling of the function is part of the interface.
  [[nodiscard]] virtual bool _os_feature_enabled_impl(std::string_view domain,
                                                      std::string_view feature) const = 0;
};

}  // namespace halvox::platform
