#include "platform/fake/FakeDevicePropertyService.h"

namespace halvox::platform {

void FakeDevicePropertyService::set(std::string_view key, const Value& value) {
  const std::lock_guard lock(mutex_);
  properties_.insert_or_assign(std::string(key), value);
}

void FakeDevicePropertyService::remove(std::string_view key) {
  const std::lock_guard lock(mutex_);
  properties_.erase(std::string(key));
}

std::size_t FakeDevicePropertyService::queries() const {
  const std::lock_guard lock(mutex_);
  return queries_;
}

std::optional<Value> FakeDevicePropertyService::copyDeviceProperty(std::string_view key) const {
  const std::lock_guard lock(mutex_);
  ++queries_;
  const auto property = properties_.find(key);
  if (property == properties_.end()) return std::nullopt;
  return property->second;
}

}  // namespace halvox::platform
