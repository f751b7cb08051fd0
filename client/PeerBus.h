#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <variant>
#include <vector>

#include <systemd/sd-bus.h>

#include "client/HalvoxClient.h"
#include "client/MessageRing.h"
#include "client/ServicePlaces.h"
#include "client/SessionTable.h"
#include "platform/linux/base/UniqueHandle.h"

// The requests of the service's protocol as messages of a peer-to-peer D-Bus connection.
namespace halvox::client {

using Bus = platform::linux_::UniqueHandle<sd_bus*, sd_bus_close_unref>;
using BusMessage = platform::linux_::UniqueHandle<sd_bus_message*, sd_bus_message_unref>;

// No time-out: the transport's own default would end calls that a busy service still answers.
inline constexpr std::uint64_t kNoTimeout = UINT64_MAX;

// A connection, its place, and the places that were tried before without finding a service.
struct ConnectedBus {
  Bus bus;
  std::string place;
  std::vector<TriedPlace> passedOver;
};

// Connects to the first of the places at which a service listens. `places` must not be empty. Does
// not wait for the service: the handshake continues in sd_bus_process(). A service that exists but
// cannot be reached ends the search. The failure names the places that were tried. The bus belongs
// to the calling thread.
std::variant<ConnectedBus, Failure> connectToService(const std::vector<std::string>& places);

// A request that is ready to be sent, or why it cannot be put on the wire.
using Request = std::variant<BusMessage, Failure>;

Request makeRequest(sd_bus* bus, const char* member);
Request makeRequest(sd_bus* bus, const char* member, ReporterID id);
Request makeRequest(sd_bus* bus, const SessionOperation& operation);
Request makeSendMessage(sd_bus* bus, const OutgoingMessage& outgoing);

// Return the failure that an answer or a negative result of sd_bus_call() means.
Failure failureFromAnswer(sd_bus* bus, sd_bus_message* answer);
Failure failureFromCall(int result, const sd_bus_error& error);

}  // namespace halvox::client
