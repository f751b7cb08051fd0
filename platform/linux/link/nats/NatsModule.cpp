#include "platform/linux/link/nats/NatsModule.h"

#include "platform/linux/link/nats/NatsEntryPoint.h"

namespace halvox::platform::linux_ {

Result<std::unique_ptr<NatsTlmReporting>> loadNatsTlmReporting(const Configuration::Link& options,
                                                               const NatsEnvironment& environment) {
  auto loaded = loadEntryPoint<decltype(halvox_link_nats_2)>(kNatsModule);
  if (!loaded) return std::move(loaded).error();
  return std::unique_ptr<NatsTlmReporting>((*loaded)(options, environment));
}

}  // namespace halvox::platform::linux_
