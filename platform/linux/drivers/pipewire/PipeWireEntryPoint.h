#pragma once

#include <chrono>

#include "platform/linux/drivers/DriverSource.h"
#include "platform/linux/modules/Module.h"
#include "platform/log.h"

namespace halvox::platform::linux_ {

inline constexpr Module kPipeWireModule{"halvox-drivers-pipewire.so", "halvox_drivers_pipewire_2"};

// Makes the source, which the caller owns and whose open() waits at most `longestOpening` for the
// server. `log` must outlive it.
extern "C" DriverSource* halvox_drivers_pipewire_2(std::chrono::milliseconds longestOpening,
                                                   LogCategory& log);

}  // namespace halvox::platform::linux_
