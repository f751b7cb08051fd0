#pragma once

#include <chrono>
#include <string>

#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/link/nats/NatsHandles.h"

namespace halvox::platform::linux_ {

// Returns the text of a status, with the client library's details of the last failure on this
// thread.
[[nodiscard]] std::string describe(natsStatus status);

// The result of provideStream().
struct StreamProvision {
  std::string failure;                    // empty on success
  std::chrono::nanoseconds duplicates{};  // how long the stream recognises a message identifier
};

// Finds the stream, or creates it if it does not exist. A stream that exists keeps its limits. An
// operator who wants other limits than ours can therefore create the stream first. Blocks for up to
// two requests, each for at most the time-out of the context.
[[nodiscard]] StreamProvision provideStream(jsCtx* context, const Configuration::Link& options);

}  // namespace halvox::platform::linux_
