#pragma once

#include "platform/linux/link/nats/NatsTlmReporting.h"
#include "platform/linux/modules/Module.h"

namespace halvox::platform::linux_ {

inline constexpr Module kNatsModule{"halvox-link-nats.so", "halvox_link_nats_2"};

// Makes the back-end. The caller owns it.
extern "C" NatsTlmReporting* halvox_link_nats_2(const Configuration::Link& options,
                                                const NatsEnvironment& environment);

}  // namespace halvox::platform::linux_
