#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace halvox::platform::linux_ {

// The names of all sessions in the tracer's daemon; none if no daemon answers. Blocks without limit
// if the daemon hangs. The control library is not thread-safe. Only one thread at a time may call
// this function.
[[nodiscard]] std::vector<std::string> tracerSessionNames();

// Destroys the sessions whose names begin with the prefix, without waiting for their data. An empty
// prefix matches none, so that sessions of others are never touched.
void destroyTracerSessions(std::string_view prefix);

}  // namespace halvox::platform::linux_
