#include "platform/linux/link/nats/NatsTlmReporting.h"

namespace halvox::platform::linux_ {

bool isNatsBuilt() { return false; }

// NOLINTNEXTLINE(performance-unnecessary-value-param): the real one keeps the settings
std::unique_ptr<NatsTlmReporting> makeNatsTlmReporting(Configuration::Link /*link*/,
                                                       const NatsEnvironment& /*environment*/) {
  return nullptr;
}

}  // namespace halvox::platform::linux_
