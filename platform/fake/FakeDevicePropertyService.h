#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <string>

#include "platform/device_properties.h"

namespace halvox::platform {

// Device properties that the test sets; none at first. Counts the look-ups, because the service may
// make only one for each process. Any thread may call. FakePlatform owns it.
class FakeDevicePropertyService final : public DevicePropertyService {
 public:
  void set(std::string_view key, const Value& value);
  void remove(std::string_view key);
  [[nodiscard]] std::size_t queries() const;

  [[nodiscard]] std::optional<Value> copyDeviceProperty(std::string_view key) const override;

 private:
  mutable std::mutex mutex_;
  std::map<std::string, Value, std::less<>> properties_;
  mutable std::size_t queries_ = 0;
};

}  // namespace halvox::platform
