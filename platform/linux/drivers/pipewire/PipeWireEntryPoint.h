#pragma once

#include <chrono>

#include "platform/linux/drivers/DriverSource.h"
#include "platform/linux/modules/Module.h"

namespace halvox::platform::linux_ {

inline constexpr Module kPipeWireModule{"halvox-drivers-pipewire.so", "halvox_drivers_pipewire_1"};

// Makes the source, which the caller owns and whose open() waits at most that long for the server.
extern "C" DriverSource* halvox_drivers_pipewire_1(std::chrono::milliseconds longestOpening);

}  // namespace halvox::platform::linux_
