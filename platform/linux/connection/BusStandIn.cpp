// Answers the requests that clients on our own socket send to "their bus". These clients have no
// bus, and the service answers in its place. To such a client, the service has its well-known name
// and the unique name ":1.0". Client number N has the unique name ":1.N".

#include <array>
#include <cstdint>
#include <optional>
#include <string>

#include <unistd.h>

#include "platform/linux/connection/BusNames.h"
#include "platform/linux/connection/ClientConnection.h"
#include "platform/linux/connection/ErrorNames.h"
#include "platform/linux/connection/StandardInterfaces.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kBus = bus_names::kBus;
constexpr std::string_view kOwnUniqueName = ":1.0";
constexpr std::uint32_t kServiceAlreadyRunning = 2;  // an answer of StartServiceByName

std::string uniqueNameOf(const ClientConnection& client) {
  return ":1." + std::to_string(client.number());
}

// Returns the unique name of the owner of `name`, or std::nullopt if the name has no owner.
std::optional<std::string> ownerOf(const StandardRequest& request, std::string_view name) {
  if (name == request.identity.busName || name == kOwnUniqueName) {
    return std::string(kOwnUniqueName);
  }
  if (name == kBus) return std::string(kBus);
  if (name == uniqueNameOf(request.client)) return std::string(name);
  return std::nullopt;
}

StandardAnswer nobodyHas(std::string_view name) {
  return {.errorName = error_names::kNameHasNoOwner,
          .errorText = "the name \"" + std::string(name) + "\" has no owner"};
}

StandardAnswer hello(const StandardRequest& request) {
  // D-Bus allows one Hello for each connection. Client libraries send Hello even if the other side
  // is not a bus.
  if (request.client.takeHello()) return {.value = Value(uniqueNameOf(request.client))};
  return {.errorName = error_names::kFailed, .errorText = "the connection already has its name"};
}

// The service sends no signals to clients. A match can therefore be accepted without storing it.
StandardAnswer takeMatch(const StandardRequest& /*request*/) { return {}; }

StandardAnswer getNameOwner(const StandardRequest& request) {
  const std::string_view name = request.arguments[0].string();
  const std::optional<std::string> owner = ownerOf(request, name);
  return owner.has_value() ? StandardAnswer{.value = Value(*owner)} : nobodyHas(name);
}

StandardAnswer nameHasOwner(const StandardRequest& request) {
  return {.value = Value(ownerOf(request, request.arguments[0].string()).has_value())};
}

StandardAnswer startServiceByName(const StandardRequest& request) {
  const std::string_view name = request.arguments[0].string();
  // GLib's proxies ask the bus to start the service before they call it.
  if (ownerOf(request, name).has_value()) return {.value = Value(kServiceAlreadyRunning)};
  return {.errorName = error_names::kServiceUnknown,
          .errorText = "there is no service \"" + std::string(name) + "\""};
}

StandardAnswer getId(const StandardRequest& request) {
  return {.value = Value(request.identity.guidHex)};
}

StandardAnswer listNames(const StandardRequest& request) {
  return {.value = Value(Array{Value(kBus), Value(request.identity.busName), Value(kOwnUniqueName),
                               Value(uniqueNameOf(request.client))})};
}

StandardAnswer listActivatableNames(const StandardRequest& /*request*/) {
  return {.value = Value(Array{})};
}

StandardAnswer getConnectionUnixProcessId(const StandardRequest& request) {
  const std::string_view name = request.arguments[0].string();
  const std::optional<std::string> owner = ownerOf(request, name);
  if (!owner.has_value()) return nobodyHas(name);
  const bool isClient = *owner == uniqueNameOf(request.client);
  // Every other name that has an owner belongs to the service or to this stand-in, which is the
  // same process.
  return {.value = Value(static_cast<std::uint32_t>(isClient ? request.client.processIdentifier()
                                                             : getpid()))};
}

constexpr StandardScope kScope = StandardScope::kStandInForBus;
constexpr std::array kBusMethods = {
    StandardMethod{kBus, "Hello", "", "s", kScope, hello},
    StandardMethod{kBus, "AddMatch", "s", "", kScope, takeMatch},
    StandardMethod{kBus, "RemoveMatch", "s", "", kScope, takeMatch},
    StandardMethod{kBus, "GetNameOwner", "s", "s", kScope, getNameOwner},
    StandardMethod{kBus, "NameHasOwner", "s", "b", kScope, nameHasOwner},
    StandardMethod{kBus, "StartServiceByName", "su", "u", kScope, startServiceByName},
    StandardMethod{kBus, "GetId", "", "s", kScope, getId},
    StandardMethod{kBus, "ListNames", "", "as", kScope, listNames},
    StandardMethod{kBus, "ListActivatableNames", "", "as", kScope, listActivatableNames},
    StandardMethod{kBus, "GetConnectionUnixProcessID", "s", "u", kScope,
                   getConnectionUnixProcessId},
};

}  // namespace

std::span<const StandardMethod> busMethods() { return kBusMethods; }

}  // namespace halvox::platform::linux_
