#include "platform/linux/link/nats/NatsTlmReporting.h"

namespace halvox::platform::linux_ {

bool isNatsBuilt() { return false; }

std::unique_ptr<NatsTlmReporting> makeNatsTlmReporting(Configuration::Link,
                                                       const NatsEnvironment&) {
  return nullptr;
}

}  // namespace halvox::platform::linux_
