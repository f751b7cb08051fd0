#include "platform/linux/drivers/ConfiguredSources.h"

#include "platform/linux/drivers/alsa/AlsaSource.h"
#include "platform/linux/drivers/textfile/TextfileSource.h"
#ifdef HALVOX_WITH_PIPEWIRE
#include "platform/linux/drivers/pipewire/PipeWireDriverSource.h"
#endif

namespace halvox::platform::linux_ {

std::vector<std::unique_ptr<DriverSource>> makeDriverSources(
    const Configuration::Drivers& drivers) {
  std::vector<std::unique_ptr<DriverSource>> sources;
  if (drivers.alsa) sources.push_back(std::make_unique<AlsaSource>(drivers.alsaRoot));
#ifdef HALVOX_WITH_PIPEWIRE
  if (drivers.pipewire) sources.push_back(std::make_unique<PipeWireDriverSource>());
#endif
  sources.push_back(std::make_unique<TextfileSource>(drivers.textfiles));
  return sources;
}

}  // namespace halvox::platform::linux_
