#include "platform/linux/configuration/ConfiguredDevicePropertyService.h"

namespace halvox::platform::linux_ {

std::optional<Value> ConfiguredDevicePropertyService::copyDeviceProperty(
    std::string_view key) const {
  const Value* value = properties_.find(key);
  if (value == nullptr) return std::nullopt;
  return *value;
}

}  // namespace halvox::platform::linux_
