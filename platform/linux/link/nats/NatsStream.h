#pragma once

#include <chrono>
#include <string>

#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/link/nats/NatsHandles.h"

namespace halvox::platform::linux_ {

// The text of a status, and the client library's detail about the last failure on this thread.
[[nodiscard]] std::string describe(natsStatus status);

// What is known of the stream after provideStream().
struct StreamProvision {
  std::string failure;                    // empty on success
  std::chrono::nanoseconds duplicates{};  // how long the stream recognises a message identifier
};

// Finds the stream, or creates it if no server knows it. A stream that exists keeps its limits: an
// operator who wants limits other than ours creates it first. Blocks for up to two requests of
// the context's time-out.
[[nodiscard]] StreamProvision provideStream(jsCtx* context, const Configuration::Link& options);

}  // namespace halvox::platform::linux_
