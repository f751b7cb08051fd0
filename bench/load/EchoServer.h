#pragma once

#include <string>

namespace halvox::bench {

// The yardstick: the least that a server on sd-bus can do for a message. Each connection's requests
// are read and answered with an empty reply, their contents are not looked at. Serves the socket on
// the calling thread until SIGTERM.
int serveEcho(const std::string& socketPath);

}  // namespace halvox::bench
