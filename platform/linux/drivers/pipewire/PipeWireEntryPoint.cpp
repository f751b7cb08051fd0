#include "platform/linux/drivers/pipewire/PipeWireEntryPoint.h"

#include <memory>

#include "platform/linux/drivers/pipewire/PipeWireDriverSource.h"

namespace halvox::platform::linux_ {

DriverSource* halvox_drivers_pipewire_2(std::chrono::milliseconds longestOpening,
                                        LogCategory& log) {
  return std::make_unique<PipeWireDriverSource>(
             log, PipeWireDriverSource::Options{.longestOpening = longestOpening})
      .release();
}

}  // namespace halvox::platform::linux_
