#pragma once

#include <filesystem>
#include <vector>

namespace halvox::platform::linux_ {

// Returns the places where a client of PipeWire looks for the server's socket, best first. They
// depend on the environment, as in PipeWire's library. Does not need the library.
[[nodiscard]] std::vector<std::filesystem::path> serverSocketPaths();

// Returns whether a socket exists at one of these places. A socket can outlive its server.
[[nodiscard]] bool hasServerSocket();

}  // namespace halvox::platform::linux_
