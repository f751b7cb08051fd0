#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace halvox {

// One channel group of the drivers to subscribe to. Immutable.
class HVReportingDriver {
 public:
  // An absent name means any.
  static HVReportingDriver driverWithGroupName(std::optional<std::string_view> groupName,
                                               std::optional<std::string_view> subGroupName);

  [[nodiscard]] const std::optional<std::string>& groupName() const { return groupName_; }
  [[nodiscard]] const std::optional<std::string>& subGroupName() const { return subGroupName_; }
  // "Haptics-Stats"; an absent name is "(null)". Snapshots are keyed by it.
  [[nodiscard]] std::string description() const;

 private:
  HVReportingDriver(std::optional<std::string> groupName, std::optional<std::string> subGroupName)
      : groupName_(std::move(groupName)), subGroupName_(std::move(subGroupName)) {}

  std::optional<std::string> groupName_;
  std::optional<std::string> subGroupName_;
};

}  // namespace halvox
