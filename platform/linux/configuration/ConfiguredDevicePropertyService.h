#pragma once

#include <optional>
#include <string_view>
#include <utility>

#include "platform/device_properties.h"

namespace halvox::platform::linux_ {

// The device properties that the configuration file sets. Immutable. Any thread may use it. Owned
// by the platform.
class ConfiguredDevicePropertyService final : public DevicePropertyService {
 public:
  explicit ConfiguredDevicePropertyService(Dictionary properties)
      : properties_(std::move(properties)) {}

  [[nodiscard]] std::optional<Value> copyDeviceProperty(std::string_view key) const override;

 private:
  const Dictionary properties_;
};

}  // namespace halvox::platform::linux_
