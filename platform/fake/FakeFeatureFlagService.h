#pragma once

#include <map>
#include <mutex>
#include <string>
#include <utility>

#include "platform/feature_flags.h"

namespace halvox::platform {

// Feature flags that the test sets; all are disabled at first. Any thread may call. FakePlatform
// owns it.
class FakeFeatureFlagService final : public FeatureFlagService {
 public:
  enum class State : unsigned char { kOff, kOn };
  void set(std::string_view domain, std::string_view feature, State state);

  [[nodiscard]] bool _os_feature_enabled_impl(std::string_view domain,
                                              std::string_view feature) const override;

 private:
  mutable std::mutex mutex_;
  std::map<std::pair<std::string, std::string>, State> states_;
};

}  // namespace halvox::platform
