#include "platform/fake/FakeFeatureFlagService.h"

namespace halvox::platform {

void FakeFeatureFlagService::set(std::string_view domain, std::string_view feature, State state) {
  const std::lock_guard lock(mutex_);
  states_[{std::string(domain), std::string(feature)}] = state;
}

bool FakeFeatureFlagService::_os_feature_enabled_impl(std::string_view domain,
                                                      std::string_view feature) const {
  const std::lock_guard lock(mutex_);
  const auto state = states_.find({std::string(domain), std::string(feature)});
  return state != states_.end() && state->second == State::kOn;
}

}  // namespace halvox::platform
