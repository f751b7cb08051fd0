#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/configuration/Configuration.h"

namespace halvox::platform::linux_ {

// Where a Unix socket listens: a file, or a name in the abstract space.
struct BusSocket {
  enum class Space : bool { kFile, kAbstract };
  Space space = Space::kFile;
  std::string name;
  friend bool operator==(const BusSocket&, const BusSocket&) = default;
};

// The Unix sockets that a D-Bus address list names, in its order. Entries of other transports and
// entries that make no sense are left out.
std::vector<BusSocket> parseBusAddress(std::string_view addresses);

// The address of a bus, from the environment or the usual place.
std::string busAddressOf(BusKind bus);

// The bus that started a process.
struct StarterBus {
  BusKind kind = BusKind::kNone;  // kNone: neither of the usual ones
  std::string address;
  friend bool operator==(const StarterBus&, const StarterBus&) = default;
};

// The bus that started this process, which it says in the environment; none when none did. A unit
// that starts the service in the place of a bus may name the kind alone.
std::optional<StarterBus> starterBus();

}  // namespace halvox::platform::linux_
