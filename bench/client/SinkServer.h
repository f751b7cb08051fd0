#pragma once

#include <string>

namespace halvox::bench {

// A server that does the least for each request: reads frames, skips them by their length, and
// sends an empty reply for each, in one write for all that one read brought. It shares no code with
// the service or the client library. Serves one connection after another, on the calling thread,
// until a signal ends the process. Returns 1 if it cannot listen.
int serveSink(const std::string& socketPath);

}  // namespace halvox::bench
