#pragma once

#include <filesystem>
#include <vector>

namespace halvox::platform::linux_ {

// Where a client of PipeWire looks for the server's socket, best first, by the rules of its
// library: the environment decides. Does not need the library.
[[nodiscard]] std::vector<std::filesystem::path> serverSocketPaths();

// Whether one of them exists. A socket can outlive its server.
[[nodiscard]] bool hasServerSocket();

}  // namespace halvox::platform::linux_
