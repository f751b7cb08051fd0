#pragma once

#include <filesystem>
#include <vector>

namespace halvox::platform::linux_ {

// Where a client of PipeWire looks for the server's socket, best first, by the rules of its
// library: the environment decides. Does not need the library.
[[nodiscard]] std::vector<std::filesystem::path> serverSocketPaths();

// Whether one of them exists. A server may be gone and its socket still be there.
[[nodiscard]] bool hasServerSocket();

}  // namespace halvox::platform::linux_
