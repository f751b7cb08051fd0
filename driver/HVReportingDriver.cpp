#include "driver/HVReportingDriver.h"

#include <utility>

namespace halvox {
namespace {

// The names outlive the views that they are made from.
std::optional<std::string> copy(std::optional<std::string_view> name) {
  if (!name.has_value()) return std::nullopt;
  return std::string(*name);
}

}  // namespace

HVReportingDriver HVReportingDriver::driverWithGroupName(
    std::optional<std::string_view> groupName, std::optional<std::string_view> subGroupName) {
  return {copy(groupName), copy(subGroupName)};
}

std::string HVReportingDriver::description() const {
  // The "(null)" is part of the interface: snapshots are keyed by this text.
  return groupName_.value_or("(null)") + "-" + subGroupName_.value_or("(null)");
}

}  // namespace halvox
