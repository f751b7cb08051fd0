#include "platform/linux/drivers/ConfiguredSources.h"

#include "platform/linux/drivers/alsa/AlsaSource.h"
#include "platform/linux/drivers/textfile/TextfileSource.h"

namespace halvox::platform::linux_ {

std::vector<std::unique_ptr<DriverSource>> makeDriverSources(
    const Configuration::Drivers& drivers) {
  std::vector<std::unique_ptr<DriverSource>> sources;
  if (drivers.alsa) sources.push_back(std::make_unique<AlsaSource>(drivers.alsaRoot));
  sources.push_back(std::make_unique<TextfileSource>(drivers.textfiles));
  return sources;
}

}  // namespace halvox::platform::linux_
