#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace halvox {

// Names one group of driver channels to subscribe to. A plain value, immutable.
class HVReportingDriver {
 public:
  // An absent name matches any.
  static HVReportingDriver driverWithGroupName(std::optional<std::string_view> groupName,
                                               std::optional<std::string_view> subGroupName);

  [[nodiscard]] const std::optional<std::string>& groupName() const { return groupName_; }
  [[nodiscard]] const std::optional<std::string>& subGroupName() const { return subGroupName_; }
  // Group and subgroup, such as "Haptics-Stats"; an absent name reads "(null)". Snapshots are keyed
  // by this text.
  [[nodiscard]] std::string description() const;

 private:
  HVReportingDriver(std::optional<std::string> groupName, std::optional<std::string> subGroupName)
      : groupName_(std::move(groupName)), subGroupName_(std::move(subGroupName)) {}

  std::optional<std::string> groupName_;
  std::optional<std::string> subGroupName_;
};

}  // namespace halvox
