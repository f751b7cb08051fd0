#pragma once

#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/device_properties.h"
#include "platform/feature_flags.h"

namespace halvox::platform::contract {

struct SwitchSetting {
  std::string domain;
  std::string feature;
  bool isOn;
};

// What every FeatureFlagService promises.
//
// `Harness` has
//   static std::unique_ptr<FeatureFlagService> make(const std::vector<SwitchSetting>& settings);
template <typename Harness>
class FeatureFlagContract : public ::testing::Test {};
TYPED_TEST_SUITE_P(FeatureFlagContract);

TYPED_TEST_P(FeatureFlagContract, UnknownFeatureIsOff) {
  const auto service = TypeParam::make({{"Acoustat", "Tracing", true}});

  EXPECT_FALSE(service->_os_feature_enabled_impl("Acoustat", "Other"));
  EXPECT_FALSE(service->_os_feature_enabled_impl("Other", "Tracing"));
  EXPECT_FALSE(service->_os_feature_enabled_impl("", ""));
}

TYPED_TEST_P(FeatureFlagContract, FeatureIsAsItWasSet) {
  const auto service =
      TypeParam::make({{"Acoustat", "Tracing", true}, {"Acoustat", "Silence", false}});

  EXPECT_TRUE(service->_os_feature_enabled_impl("Acoustat", "Tracing"));
  EXPECT_FALSE(service->_os_feature_enabled_impl("Acoustat", "Silence"));
}

TYPED_TEST_P(FeatureFlagContract, NamesAreComparedByteForByte) {
  const auto service = TypeParam::make({{"Acoustat", "Tracing", true}});

  EXPECT_FALSE(service->_os_feature_enabled_impl("acoustat", "Tracing"));
  EXPECT_FALSE(service->_os_feature_enabled_impl("Acoustat", "Tracing "));
}

REGISTER_TYPED_TEST_SUITE_P(FeatureFlagContract, UnknownFeatureIsOff, FeatureIsAsItWasSet,
                            NamesAreComparedByteForByte);

// What every DevicePropertyService promises.
//
// `Harness` has
//   static std::unique_ptr<DevicePropertyService> make(const Dictionary& properties);
template <typename Harness>
class DevicePropertyContract : public ::testing::Test {};
TYPED_TEST_SUITE_P(DevicePropertyContract);

TYPED_TEST_P(DevicePropertyContract, UnsetPropertyHasNoValue) {
  const auto service = TypeParam::make({});

  EXPECT_FALSE(service->copyDeviceProperty("InternalBuild").has_value());
}

TYPED_TEST_P(DevicePropertyContract, PropertyHasTheValueThatWasSet) {
  const auto service = TypeParam::make({{"InternalBuild", true}, {"Model", "D1"}});

  EXPECT_EQ(service->copyDeviceProperty("InternalBuild"), Value(true));
  EXPECT_EQ(service->copyDeviceProperty("Model"), Value("D1"));
  EXPECT_FALSE(service->copyDeviceProperty("model").has_value());
}

REGISTER_TYPED_TEST_SUITE_P(DevicePropertyContract, UnsetPropertyHasNoValue,
                            PropertyHasTheValueThatWasSet);

}  // namespace halvox::platform::contract
