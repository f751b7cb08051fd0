#include "platform/linux/drivers/pipewire/PipeWireEntryPoint.h"

#include <memory>

#include "platform/linux/drivers/pipewire/PipeWireDriverSource.h"

namespace halvox::platform::linux_ {

DriverSource* halvox_drivers_pipewire_1(std::chrono::milliseconds longestOpening) {
  return std::make_unique<PipeWireDriverSource>(
             PipeWireDriverSource::Options{.longestOpening = longestOpening})
      .release();
}

}  // namespace halvox::platform::linux_
