#include "platform/linux/configuration/ConfiguredFeatureFlagService.h"

namespace halvox::platform::linux_ {

bool ConfiguredFeatureFlagService::_os_feature_enabled_impl(std::string_view domain,
                                                            std::string_view feature) const {
  const auto features = switches_.find(domain);
  if (features == switches_.end()) return false;
  const auto found = features->second.find(feature);
  return found != features->second.end() && found->second;
}

}  // namespace halvox::platform::linux_
