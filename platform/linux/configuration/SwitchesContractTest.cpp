#include "platform/fake/contracts/SwitchesContract.h"

#include <memory>
#include <utility>
#include <vector>

#include "platform/linux/configuration/ConfiguredDevicePropertyService.h"
#include "platform/linux/configuration/ConfiguredFeatureFlagService.h"

namespace halvox::platform::contract {

namespace adapters {

struct ConfiguredFeatureFlags {
  static std::unique_ptr<FeatureFlagService> make(const std::vector<SwitchSetting>& settings) {
    linux_::FeatureSwitches switches;
    for (const auto& [domain, feature, isOn] : settings) switches[domain][feature] = isOn;
    return std::make_unique<linux_::ConfiguredFeatureFlagService>(std::move(switches));
  }
};

struct ConfiguredDeviceProperties {
  static std::unique_ptr<DevicePropertyService> make(const Dictionary& properties) {
    return std::make_unique<linux_::ConfiguredDevicePropertyService>(properties);
  }
};

}  // namespace adapters

INSTANTIATE_TYPED_TEST_SUITE_P(Configured, FeatureFlagContract, adapters::ConfiguredFeatureFlags);
INSTANTIATE_TYPED_TEST_SUITE_P(Configured, DevicePropertyContract,
                               adapters::ConfiguredDeviceProperties);

}  // namespace halvox::platform::contract
