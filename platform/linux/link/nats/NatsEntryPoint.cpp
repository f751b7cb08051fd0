#include "platform/linux/link/nats/NatsEntryPoint.h"

namespace halvox::platform::linux_ {

NatsTlmReporting* halvox_link_nats_2(const Configuration::Link& options,
                                     const NatsEnvironment& environment) {
  return makeNatsTlmReporting(options, environment).release();
}

}  // namespace halvox::platform::linux_
