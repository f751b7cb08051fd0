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
#include "client/SessionTable.h"
#include "platform/linux/UniqueHandle.h"

// The requests of the service's protocol as messages of a peer-to-peer D-Bus connection.
namespace halvox::client {

using Bus = platform::linux_::UniqueHandle<sd_bus*, sd_bus_close_unref>;
using BusMessage = platform::linux_::UniqueHandle<sd_bus_message*, sd_bus_message_unref>;

// No time-out: the transport's own default would end calls that a busy service still answers.
inline constexpr std::uint64_t kNoTimeout = UINT64_MAX;

// Connects to the service's socket without waiting for the service; the handshake goes on in
// sd_bus_process(). The bus belongs to the calling thread.
std::variant<Bus, Failure> connectToService(const std::string& socketPath);

// A request that is ready to be sent, or why it cannot be put on the wire.
using Request = std::variant<BusMessage, Failure>;

Request makeRequest(sd_bus* bus, const char* member);
Request makeRequest(sd_bus* bus, const char* member, ReporterID id);
Request makeRequest(sd_bus* bus, const SessionOperation& operation);
Request makeSendMessage(sd_bus* bus, const OutgoingMessage& outgoing);

// The failure that an answer or a negative result of sd_bus_call() stands for.
Failure failureFromAnswer(sd_bus* bus, sd_bus_message* answer);
Failure failureFromCall(int result, const sd_bus_error& error);

}  // namespace halvox::client
