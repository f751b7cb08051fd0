#pragma once

#include <string>

namespace halvox::bench {

// The reference for all ratios: the least that a server on sd-bus can do for a message. Reads the
// requests of each connection and sends empty replies without looking at the contents. Serves the
// socket on the calling thread until SIGTERM ends the process. Returns 1 if it cannot listen.
int serveEcho(const std::string& socketPath);

}  // namespace halvox::bench
