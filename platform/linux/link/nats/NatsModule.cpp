#include "platform/linux/link/nats/NatsModule.h"

#include "platform/linux/link/nats/NatsEntryPoint.h"

namespace halvox::platform::linux_ {

std::variant<std::unique_ptr<NatsTlmReporting>, std::string> loadNatsTlmReporting(
    const Configuration::Link& options, const NatsEnvironment& environment) {
  auto loaded = loadEntryPoint<decltype(halvox_link_nats_1)>(kNatsModule);
  if (auto* why = std::get_if<std::string>(&loaded)) return std::move(*why);
  return std::unique_ptr<NatsTlmReporting>(
      std::get<decltype(&halvox_link_nats_1)>(loaded)(options, environment));
}

}  // namespace halvox::platform::linux_
