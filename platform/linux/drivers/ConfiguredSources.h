#pragma once

#include <memory>
#include <vector>

#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/drivers/DriverSource.h"

namespace halvox::platform::linux_ {

// The sources of driver counters that the configuration wants and this build has.
[[nodiscard]] std::vector<std::unique_ptr<DriverSource>> makeDriverSources(
    const Configuration::Drivers& drivers);

}  // namespace halvox::platform::linux_
