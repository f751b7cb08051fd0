#pragma once

#include <memory>
#include <vector>

#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/drivers/DriverSource.h"
#include "platform/log.h"

namespace halvox::platform::linux_ {

// Makes the sources of driver counters that the configuration enables and this build contains. The
// caller owns them. Nothing is read yet. The PipeWire source loads its module itself, when it needs
// it. `log` must outlive the sources.
[[nodiscard]] std::vector<std::unique_ptr<DriverSource>> makeDriverSources(
    const Configuration::Drivers& drivers, LogCategory& log);

// Returns whether this build has the ALSA source.
[[nodiscard]] bool hasAlsaSource();

}  // namespace halvox::platform::linux_
