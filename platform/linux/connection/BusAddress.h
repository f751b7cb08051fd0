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

// The Unix sockets in a D-Bus address list, in the order of the list. Skips entries of other
// transports and malformed entries.
std::vector<BusSocket> parseBusAddress(std::string_view addresses);

// The address of a bus: from the environment, else the default one. Empty for kNone, and for a
// session bus that the environment does not name.
std::string busAddressOf(BusKind bus);

// The bus that started a process.
struct StarterBus {
  BusKind kind = BusKind::kNone;  // kNone: neither the session bus nor the system bus
  std::string address;
  friend bool operator==(const StarterBus&, const StarterBus&) = default;
};

// The bus that started this process, as the environment names it; none if no bus did. A systemd
// unit that starts the service on behalf of a bus may set the kind without the address.
std::optional<StarterBus> starterBus();

}  // namespace halvox::platform::linux_
