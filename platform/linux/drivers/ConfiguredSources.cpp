#include "platform/linux/drivers/ConfiguredSources.h"

#include "platform/linux/drivers/pipewire/PipeWireOnDemand.h"
#include "platform/linux/drivers/textfile/TextfileSource.h"
#ifdef HALVOX_ALSA
#include "platform/linux/drivers/alsa/AlsaSource.h"
#endif

namespace halvox::platform::linux_ {

std::vector<std::unique_ptr<DriverSource>> makeDriverSources(const Configuration::Drivers& drivers,
                                                             LogCategory& log) {
  std::vector<std::unique_ptr<DriverSource>> sources;
#ifdef HALVOX_ALSA
  if (drivers.alsa) sources.push_back(std::make_unique<AlsaSource>(drivers.alsaRoot));
#endif
  if (drivers.pipewire) sources.push_back(std::make_unique<PipeWireOnDemand>(log));
  sources.push_back(std::make_unique<TextfileSource>(drivers.textfiles, log));
  return sources;
}

bool hasAlsaSource() {
#ifdef HALVOX_ALSA
  return true;
#else
  return false;
#endif
}

}  // namespace halvox::platform::linux_
