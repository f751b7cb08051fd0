#include "client/PeerBus.h"

#include <cerrno>
#include <cstring>
#include <string_view>
#include <utility>

#include <sys/socket.h>
#include <sys/un.h>

#include "client/Overloaded.h"
#include "client/WireValue.h"
#include "platform/linux/base/ErrnoText.h"

namespace halvox::client {
namespace {

using platform::linux_::UniqueFd;

constexpr const char* kObjectPath = "/com/tarno/halvox/reporting";
constexpr const char* kInterface = "com.tarno.halvox.HVReportingServiceProtocol";

Failure badRequest(std::string message) {
  return {Failure::Kind::kBadRequest, "", std::move(message)};
}

Failure badRequest(int error) {
  return badRequest("the request cannot be sent: " + platform::linux_::errnoText(error));
}

// Connects a non-blocking stream to a socket. On failure the second member is the errno.
std::pair<UniqueFd, int> connectSocket(const std::string& socketPath) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (socketPath.size() >= sizeof address.sun_path) return {UniqueFd(), ENAMETOOLONG};
  std::memcpy(address.sun_path, socketPath.data(), socketPath.size());

  UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!fd) return {UniqueFd(), errno};
  // With a full backlog this fails with EAGAIN, so a stalled service does not block the caller.
  if (connect(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) < 0) {
    return {UniqueFd(), errno};
  }
  return {std::move(fd), 0};
}

// Returns 0 or an errno.
int startBus(UniqueFd fd, Bus& bus) {
  int result = sd_bus_new(bus.out());
  if (result < 0) return -result;
  result = sd_bus_set_fd(bus.get(), fd.get(), fd.get());
  if (result < 0) return -result;
  static_cast<void>(fd.release());  // the bus owns it from here on
  result = sd_bus_negotiate_fds(bus.get(), 0);
  if (result >= 0) result = sd_bus_start(bus.get());
  return result < 0 ? -result : 0;
}

Request finish(BusMessage message, int result) {
  if (result < 0) return badRequest(-result);
  return message;
}

Request makeSetConfiguration(sd_bus* bus, ReporterID id, const Dictionary& configuration) {
  Request request = makeRequest(bus, "setConfiguration");
  auto* message = std::get_if<BusMessage>(&request);
  if (message == nullptr) return request;
  if (auto error = appendDictionary(message->get(), configuration)) return badRequest(*error);
  const int result = sd_bus_message_append(message->get(), "x", id);
  return finish(std::move(*message), result);
}

Request makeSetServiceType(sd_bus* bus, ReporterID id, ServiceType type) {
  Request request = makeRequest(bus, "setServiceType");
  auto* message = std::get_if<BusMessage>(&request);
  if (message == nullptr) return request;
  const int result = sd_bus_message_append(message->get(), "qx", type, id);
  return finish(std::move(*message), result);
}

// Appends zero or one array of IDs. No array stands for all active sessions.
int appendRecipients(sd_bus_message* message, const Recipients& recipients) {
  std::span<const ReporterID> ids;
  if (const auto* one = std::get_if<ReporterID>(&recipients)) ids = std::span(one, 1);
  if (const auto* list = std::get_if<std::vector<ReporterID>>(&recipients)) ids = *list;
  if (const int result = sd_bus_message_open_container(message, 'a', "ax"); result < 0) {
    return result;
  }
  if (!std::holds_alternative<std::monostate>(recipients)) {
    const int result = sd_bus_message_append_array(message, 'x', ids.data(), ids.size_bytes());
    if (result < 0) return result;
  }
  return sd_bus_message_close_container(message);
}

}  // namespace

std::variant<ConnectedBus, Failure> connectToService(const std::vector<std::string>& places) {
  std::vector<TriedPlace> tried;
  for (const std::string& place : places) {
    auto [fd, error] = connectSocket(place);
    Bus bus;
    if (error == 0) error = startBus(std::move(fd), bus);
    if (error == 0) return ConnectedBus{std::move(bus), place, std::move(tried)};
    tried.push_back({place, error});
    if (!meansAbsence(error)) break;
  }
  return Failure{Failure::Kind::kNoService, "", describeTried("service", tried)};
}

Request makeRequest(sd_bus* bus, const char* member) {
  BusMessage message;
  const int result =
      sd_bus_message_new_method_call(bus, message.out(), nullptr, kObjectPath, kInterface, member);
  return finish(std::move(message), result);
}

Request makeRequest(sd_bus* bus, const char* member, ReporterID id) {
  Request request = makeRequest(bus, member);
  auto* message = std::get_if<BusMessage>(&request);
  if (message == nullptr) return request;
  const int result = sd_bus_message_append(message->get(), "x", id);
  return finish(std::move(*message), result);
}

Request makeRequest(sd_bus* bus, const SessionOperation& operation) {
  const ReporterID id = operation.id;
  return std::visit(
      Overloaded{
          [&](const CreateSession&) { return makeRequest(bus, "createReportingSession", id); },
          [&](ServiceType type) { return makeSetServiceType(bus, id, type); },
          [&](const Dictionary& configuration) {
            return makeSetConfiguration(bus, id, configuration);
          },
          [&](const StartSession&) { return makeRequest(bus, "startReportingSessionForID", id); },
          [&](const StopSession&) { return makeRequest(bus, "stopReportingSessionForID", id); },
          [&](const DestroySession&) { return makeRequest(bus, "destroyReportingSession", id); },
      },
      operation.step);
}

Request makeSendMessage(sd_bus* bus, const OutgoingMessage& outgoing) {
  Request request = makeRequest(bus, "sendMessage");
  auto* message = std::get_if<BusMessage>(&request);
  if (message == nullptr) return request;
  if (auto error = appendDictionary(message->get(), outgoing.message)) return badRequest(*error);
  int result = sd_bus_message_append(message->get(), "uq", outgoing.category, outgoing.type);
  if (result >= 0) result = appendRecipients(message->get(), outgoing.recipients);
  return finish(std::move(*message), result);
}

Failure failureFromAnswer(sd_bus* bus, sd_bus_message* answer) {
  // When the connection ends, the library itself answers open calls with an error.
  if (sd_bus_is_open(bus) <= 0) {
    return {Failure::Kind::kNoService, "", "the service ended the connection"};
  }
  const sd_bus_error* error = sd_bus_message_get_error(answer);
  if (error == nullptr) return badRequest("the service's answer makes no sense");
  return {Failure::Kind::kRefused, error->name,
          error->message != nullptr ? error->message : "the service gave no reason"};
}

Failure failureFromCall(int result, const sd_bus_error& error) {
  switch (-result) {
    case ETIMEDOUT:
      return {Failure::Kind::kTimedOut, "", "no answer from the service in time"};
    case ECONNRESET:
    case ENOTCONN:
    case EPIPE:
    case ECONNABORTED:
    case ESHUTDOWN:
      return {Failure::Kind::kNoService, "", "the service ended the connection"};
    default:  // the set of errors is the system's
      break;
  }
  if (sd_bus_error_is_set(&error) != 0) {
    return {Failure::Kind::kRefused, error.name, error.message != nullptr ? error.message : ""};
  }
  return badRequest(-result);
}

}  // namespace halvox::client
