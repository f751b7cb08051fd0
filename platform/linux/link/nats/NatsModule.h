#pragma once

#include <memory>

#include "platform/linux/base/Result.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"

namespace halvox::platform::linux_ {

// Loads halvox-link-nats.so, and with it the client library of NATS and OpenSSL. Returns the
// back-end, or why the module cannot be loaded. The back-end does not connect until a session looks
// for back-ends.
[[nodiscard]] Result<std::unique_ptr<NatsTlmReporting>> loadNatsTlmReporting(
    const Configuration::Link& options, const NatsEnvironment& environment);

}  // namespace halvox::platform::linux_
