#pragma once

#include <memory>
#include <string>
#include <variant>

#include "platform/linux/link/nats/NatsTlmReporting.h"

namespace halvox::platform::linux_ {

// Loads halvox-link-nats.so, which brings the client library of NATS and, with it, OpenSSL. Returns
// the back-end, or why the module cannot be loaded. Connects nowhere before a session asks.
[[nodiscard]] std::variant<std::unique_ptr<NatsTlmReporting>, std::string> loadNatsTlmReporting(
    const Configuration::Link& options, const NatsEnvironment& environment);

}  // namespace halvox::platform::linux_
