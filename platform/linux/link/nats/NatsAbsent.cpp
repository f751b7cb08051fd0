#include "platform/linux/link/nats/NatsTlmReporting.h"

namespace halvox::platform::linux_ {

bool isNatsBuilt() { return false; }

// Takes the settings by value as the real one does, which keeps them.
// NOLINTNEXTLINE(performance-unnecessary-value-param)
std::unique_ptr<NatsTlmReporting> makeNatsTlmReporting(Configuration::Link /*link*/,
                                                       const NatsEnvironment& /*environment*/) {
  return nullptr;
}

}  // namespace halvox::platform::linux_
