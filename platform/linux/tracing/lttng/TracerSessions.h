#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace halvox::platform::linux_ {

// The names of all sessions that the tracer's daemon has; none when no daemon answers. Waits for
// the daemon, without end if it hangs. The control library is not for several threads at once.
[[nodiscard]] std::vector<std::string> tracerSessionNames();

// Destroys the sessions whose names start so, without waiting for what they recorded. An empty
// prefix names none: those of others are never touched.
void destroyTracerSessions(std::string_view prefix);

}  // namespace halvox::platform::linux_
