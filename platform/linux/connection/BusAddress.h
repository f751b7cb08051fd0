#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/configuration/Configuration.h"

namespace halvox::platform::linux_ {

// The address of a Unix socket: a file, or a name in the abstract namespace.
struct BusSocket {
  enum class Space : bool { kFile, kAbstract };
  Space space = Space::kFile;
  std::string name;
  friend bool operator==(const BusSocket&, const BusSocket&) = default;
};

// Returns the Unix sockets in a D-Bus address list, in the order of the list. Skips entries of
// other transports and malformed entries.
std::vector<BusSocket> parseBusAddress(std::string_view addresses);

// Returns the address of a bus: the one in the environment, or the default if the environment has
// none. Empty for kNone, and for a session bus that the environment does not name.
std::string busAddressOf(BusKind bus);

// The bus that started a process.
struct StarterBus {
  BusKind kind = BusKind::kNone;  // kNone: neither the session bus nor the system bus
  std::string address;
  friend bool operator==(const StarterBus&, const StarterBus&) = default;
};

// Returns the bus that started this process, according to the environment; std::nullopt if no bus
// did. If a systemd unit starts the service on behalf of a bus, the environment may have the kind
// of the bus without its address. The address is then that of busAddressOf().
std::optional<StarterBus> starterBus();

}  // namespace halvox::platform::linux_
