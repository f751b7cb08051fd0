#pragma once

#include <memory>
#include <vector>

#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/drivers/DriverSource.h"
#include "platform/log.h"

namespace halvox::platform::linux_ {

// Makes the sources of driver counters that the configuration enables and this build contains. The
// caller owns them. Nothing is read yet. The source of PipeWire loads its module by itself.
// `log` must outlive the sources.
[[nodiscard]] std::vector<std::unique_ptr<DriverSource>> makeDriverSources(
    const Configuration::Drivers& drivers, LogCategory& log);

// Whether this build has the source of ALSA.
[[nodiscard]] bool hasAlsaSource();

}  // namespace halvox::platform::linux_
