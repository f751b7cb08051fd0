#include "platform/linux/connection/BusAddress.h"

#include <charconv>
#include <cstdlib>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

// Removes from `text` everything up to and including the first separator. Returns the part before
// the separator.
std::string_view takePart(std::string_view& text, char separator) {
  const std::size_t end = text.find(separator);
  const std::string_view part = text.substr(0, end);
  text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
  return part;
}

// Returns the value with its %XX escapes decoded, or std::nullopt if an escape is malformed.
std::optional<std::string> unescaped(std::string_view value) {
  std::string result;
  while (!value.empty()) {
    if (value.front() != '%') {
      result += value.front();
      value.remove_prefix(1);
      continue;
    }
    if (value.size() < 3) return std::nullopt;
    unsigned byte = 0;
    const char* const end = value.data() + 3;
    if (std::from_chars(value.data() + 1, end, byte, 16).ptr != end) return std::nullopt;
    result += static_cast<char>(byte);
    value.remove_prefix(3);
  }
  return result;
}

std::string environment(const char* name) {
  const char* value = std::getenv(name);
  return value != nullptr ? value : "";
}

std::optional<BusSocket> parseEntry(std::string_view entry) {
  if (takePart(entry, ':') != "unix") return std::nullopt;
  while (!entry.empty()) {
    std::string_view pair = takePart(entry, ',');
    const std::string_view key = takePart(pair, '=');
    if (key != "path" && key != "abstract") continue;
    std::optional<std::string> name = unescaped(pair);
    if (!name.has_value() || name->empty()) return std::nullopt;
    return BusSocket{key == "path" ? BusSocket::Space::kFile : BusSocket::Space::kAbstract,
                     *std::move(name)};
  }
  return std::nullopt;
}

}  // namespace

std::vector<BusSocket> parseBusAddress(std::string_view addresses) {
  std::vector<BusSocket> sockets;
  while (!addresses.empty()) {
    std::optional<BusSocket> socket = parseEntry(takePart(addresses, ';'));
    if (socket.has_value()) sockets.push_back(*std::move(socket));
  }
  return sockets;
}

std::string busAddressOf(BusKind bus) {
  switch (bus) {
    case BusKind::kNone:
      return "";
    case BusKind::kSession: {
      if (std::string address = environment("DBUS_SESSION_BUS_ADDRESS"); !address.empty()) {
        return address;
      }
      const std::string runtime = environment("XDG_RUNTIME_DIR");
      // If the variable is not set, the bus is where systemd's user manager puts the bus of a
      // login.
      return runtime.empty() ? "" : "unix:path=" + runtime + "/bus";
    }
    case BusKind::kSystem: {
      const std::string address = environment("DBUS_SYSTEM_BUS_ADDRESS");
      // D-Bus defines this path for the system bus.
      return address.empty() ? "unix:path=/run/dbus/system_bus_socket" : address;
    }
  }
  return "";
}

std::optional<StarterBus> starterBus() {
  const std::string type = environment("DBUS_STARTER_BUS_TYPE");
  StarterBus bus{.kind = BusKind::kNone, .address = environment("DBUS_STARTER_ADDRESS")};
  if (type == "session") bus.kind = BusKind::kSession;
  if (type == "system") bus.kind = BusKind::kSystem;
  if (bus.address.empty()) bus.address = busAddressOf(bus.kind);
  if (bus.address.empty()) return std::nullopt;
  return bus;
}

}  // namespace halvox::platform::linux_
