#include <algorithm>
#include <cerrno>
#include <map>
#include <utility>

#include "client/HalvoxClient.h"
#include "client/PeerBus.h"
#include "client/WireValue.h"

namespace halvox::client {
namespace {

using Deadline = std::chrono::steady_clock::time_point;
using BusSlot = platform::linux_::UniqueHandle<sd_bus_slot*, sd_bus_slot_unref>;

// Without a limit, sd_bus_call() would wait for ever for a service that does not answer.
constexpr std::chrono::milliseconds kShortestTimeout{1};
// Larger durations could overflow the clock's time points.
constexpr std::chrono::milliseconds kLongestTimeout = std::chrono::hours(24 * 365);

std::chrono::milliseconds bounded(std::chrono::milliseconds timeout) {
  return std::clamp(timeout, kShortestTimeout, kLongestTimeout);
}

std::uint64_t toMicroseconds(std::chrono::milliseconds timeout) {
  return static_cast<std::uint64_t>(std::chrono::microseconds(timeout).count());
}

struct BusError {
  sd_bus_error raw = SD_BUS_ERROR_NULL;
  BusError() = default;
  ~BusError() { sd_bus_error_free(&raw); }
  BusError(const BusError&) = delete;
  BusError& operator=(const BusError&) = delete;
};

// Handles what has arrived, then waits for more, until the deadline at most. Returns a negative
// errno if the connection ended or the deadline has passed.
int processUntil(sd_bus* bus, Deadline deadline) {
  const int processed = sd_bus_process(bus, nullptr);
  if (processed < 0) return processed;
  if (sd_bus_is_open(bus) <= 0) return -ECONNRESET;
  if (processed > 0) return 0;
  const auto left = std::chrono::duration_cast<std::chrono::microseconds>(
      deadline - std::chrono::steady_clock::now());
  if (left.count() <= 0) return -ETIMEDOUT;
  const int waited = sd_bus_wait(bus, static_cast<std::uint64_t>(left.count()));
  return waited == -EINTR ? 0 : std::min(waited, 0);
}

template <typename T>
Result<T> failed(Failure failure) {
  return {std::nullopt, std::move(failure)};
}

Failure senseless() {
  return {Failure::Kind::kRefused, "", "the service's answer has not the type that was expected"};
}

Result<bool> readBool(sd_bus_message* answer) {
  int value = 0;
  if (sd_bus_message_read_basic(answer, 'b', &value) <= 0) return failed<bool>(senseless());
  return {value != 0, std::nullopt};
}

// The answer to a start, which comes when the session is stopped.
struct HeldReply {
  sd_bus* bus = nullptr;
  BusSlot slot;
  std::optional<Result<bool>> answer;
};

int onHeldReply(sd_bus_message* answer, void* userData, sd_bus_error* /*error*/) {
  auto& held = *static_cast<HeldReply*>(userData);
  if (sd_bus_is_open(held.bus) <= 0 || sd_bus_message_is_method_error(answer, nullptr) > 0) {
    held.answer = failed<bool>(failureFromAnswer(held.bus, answer));
  } else {
    held.answer = readBool(answer);
  }
  return 0;
}

}  // namespace

class HalvoxConnection::Impl {
 public:
  Impl(ConnectedBus connected, std::chrono::milliseconds timeout)
      : connected_(std::move(connected)), timeout_(bounded(timeout)) {}

  [[nodiscard]] sd_bus* bus() const { return connected_.bus.get(); }
  [[nodiscard]] const std::string& place() const { return connected_.place; }
  [[nodiscard]] const std::vector<TriedPlace>& passedOver() const { return connected_.passedOver; }
  [[nodiscard]] Deadline deadline() const { return std::chrono::steady_clock::now() + timeout_; }

  Result<BusMessage> ask(Request&& request) {
    if (auto* failure = std::get_if<Failure>(&request)) {
      return failed<BusMessage>(std::move(*failure));
    }
    BusError error;
    BusMessage answer;
    const int result = sd_bus_call(bus(), std::get<BusMessage>(request).get(),
                                   toMicroseconds(timeout_), &error.raw, answer.out());
    if (result < 0) return failed<BusMessage>(failureFromCall(result, error.raw));
    return {std::move(answer), std::nullopt};
  }

  Result<bool> askBool(Request&& request) {
    auto answer = ask(std::move(request));
    if (!answer) return failed<bool>(std::move(*answer.failure));
    return readBool(answer.value->get());
  }

  std::map<ReporterID, std::unique_ptr<HeldReply>>& heldReplies() { return heldReplies_; }

 private:
  ConnectedBus connected_;
  std::chrono::milliseconds timeout_;
  std::map<ReporterID, std::unique_ptr<HeldReply>> heldReplies_;  // the slots go before the bus
};

HalvoxConnection::HalvoxConnection(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}

HalvoxConnection::~HalvoxConnection() = default;

Result<std::unique_ptr<HalvoxConnection>> HalvoxConnection::open(
    const std::string& socketPath, std::chrono::milliseconds timeout) {
  using Opened = std::unique_ptr<HalvoxConnection>;
  auto connected = connectToService(socketPlaces(socketPath));
  if (auto* failure = std::get_if<Failure>(&connected)) {
    return failed<Opened>(std::move(*failure));
  }
  auto impl = std::make_unique<Impl>(std::move(std::get<ConnectedBus>(connected)), timeout);
  const Deadline deadline = impl->deadline();
  while (sd_bus_is_ready(impl->bus()) <= 0) {
    if (const int result = processUntil(impl->bus(), deadline); result < 0) {
      return failed<Opened>(
          {result == -ETIMEDOUT ? Failure::Kind::kTimedOut : Failure::Kind::kNoService, "",
           "the service at " + impl->place() + " does not answer"});
    }
  }
  return {Opened(new HalvoxConnection(std::move(impl))), std::nullopt};
}

const std::string& HalvoxConnection::socketPath() const { return impl_->place(); }

std::vector<std::string> HalvoxConnection::unservedSockets() const {
  std::vector<std::string> paths;
  for (const TriedPlace& tried : impl_->passedOver()) {
    if (tried.error == ECONNREFUSED) paths.push_back(tried.path);
  }
  return paths;
}

Result<bool> HalvoxConnection::createReportingSession(ReporterID id) {
  return impl_->askBool(makeRequest(impl_->bus(), {id, CreateSession{}}));
}

Result<bool> HalvoxConnection::setServiceType(ServiceType type, ReporterID id) {
  return impl_->askBool(makeRequest(impl_->bus(), {id, type}));
}

Result<ServiceType> HalvoxConnection::getServiceNameForReporterID(ReporterID id) {
  auto answer = impl_->ask(makeRequest(impl_->bus(), "getServiceNameForReporterID", id));
  if (!answer) return failed<ServiceType>(std::move(*answer.failure));
  ServiceType type = 0;
  if (sd_bus_message_read_basic(answer.value->get(), 'q', &type) <= 0) {
    return failed<ServiceType>(senseless());
  }
  return {type, std::nullopt};
}

Result<bool> HalvoxConnection::setConfiguration(const Dictionary& configuration, ReporterID id) {
  return impl_->askBool(makeRequest(impl_->bus(), {id, configuration}));
}

Result<bool> HalvoxConnection::startReportingSessionForID(ReporterID id) {
  Request request = makeRequest(impl_->bus(), {id, StartSession{}});
  if (auto* failure = std::get_if<Failure>(&request)) return failed<bool>(std::move(*failure));
  auto held = std::make_unique<HeldReply>();
  held->bus = impl_->bus();
  const int result =
      sd_bus_call_async(impl_->bus(), held->slot.out(), std::get<BusMessage>(request).get(),
                        onHeldReply, held.get(), kNoTimeout);
  if (result < 0) return failed<bool>(failureFromCall(result, SD_BUS_ERROR_NULL));
  const HeldReply& reply = *(impl_->heldReplies()[id] = std::move(held));

  // Requests are carried out in order, so this is answered after the start was carried out.
  auto query = impl_->ask(makeRequest(impl_->bus(), "reporterIDValid", id));
  if (!query) return failed<bool>(std::move(*query.failure));
  // The answer to a refused start has arrived by now.
  while (!reply.answer && sd_bus_process(impl_->bus(), nullptr) > 0) {
  }
  if (reply.answer && !*reply.answer) return *reply.answer;
  return {true, std::nullopt};
}

Result<bool> HalvoxConnection::waitForStartReply(ReporterID id, std::chrono::milliseconds timeout) {
  const auto found = impl_->heldReplies().find(id);
  if (found == impl_->heldReplies().end()) {
    return failed<bool>(
        {Failure::Kind::kBadRequest, "",
         "session " + std::to_string(id) + " was not started over this connection"});
  }
  const Deadline deadline = std::chrono::steady_clock::now() + bounded(timeout);
  while (!found->second->answer) {
    const int result = processUntil(impl_->bus(), deadline);
    if (found->second->answer) break;
    if (result < 0) return failed<bool>(failureFromCall(result, SD_BUS_ERROR_NULL));
  }
  return *found->second->answer;
}

Result<bool> HalvoxConnection::sendMessage(const Dictionary& message, Category category,
                                           EventType type,
                                           const std::optional<std::vector<ReporterID>>& ids) {
  OutgoingMessage outgoing{
      .recipients = {}, .message = message, .category = category, .type = type};
  if (ids) outgoing.recipients = *ids;
  auto answer = impl_->ask(makeSendMessage(impl_->bus(), outgoing));
  if (!answer) return failed<bool>(std::move(*answer.failure));
  return {true, std::nullopt};
}

Result<bool> HalvoxConnection::stopReportingSessionForID(ReporterID id) {
  return impl_->askBool(makeRequest(impl_->bus(), {id, StopSession{}}));
}

Result<bool> HalvoxConnection::destroyReportingSession(ReporterID id) {
  return impl_->askBool(makeRequest(impl_->bus(), {id, DestroySession{}}));
}

Result<Dictionary> HalvoxConnection::reporterIDValid(ReporterID id) {
  auto answer = impl_->ask(makeRequest(impl_->bus(), "reporterIDValid", id));
  if (!answer) return failed<Dictionary>(std::move(*answer.failure));
  const auto value = readValue(answer.value->get());
  if (!value || !value->isDictionary()) return failed<Dictionary>(senseless());
  return {value->dictionary(), std::nullopt};
}

Result<std::vector<ReporterID>> HalvoxConnection::getAllReporters() {
  using IDs = std::vector<ReporterID>;
  auto answer = impl_->ask(makeRequest(impl_->bus(), "getAllReporters"));
  if (!answer) return failed<IDs>(std::move(*answer.failure));
  const void* ids = nullptr;
  std::size_t size = 0;
  if (sd_bus_message_read_array(answer.value->get(), 'x', &ids, &size) < 0) {
    return failed<IDs>(senseless());
  }
  const auto* first = static_cast<const ReporterID*>(ids);
  return {IDs(first, first + size / sizeof(ReporterID)), std::nullopt};
}

Result<bool> HalvoxConnection::killService() {
  const auto answer = impl_->ask(makeRequest(impl_->bus(), "killService"));
  if (answer) return failed<bool>(senseless());
  if (answer.failure->kind == Failure::Kind::kNoService) return {true, std::nullopt};
  return failed<bool>(*answer.failure);
}

}  // namespace halvox::client
