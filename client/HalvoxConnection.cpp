#include <algorithm>
#include <cerrno>
#include <map>
#include <utility>

#include "client/HalvoxClient.h"
#include "client/PollUntil.h"
#include "client/RequestEncoder.h"
#include "client/ServiceStream.h"
#include "platform/linux/connection/wire/ValueDecoder.h"

namespace halvox::client {
namespace {

namespace dbus = platform::linux_::dbus;
using Deadline = std::chrono::steady_clock::time_point;

// The shortest time-out. It is long enough to look at the socket once.
constexpr std::chrono::milliseconds kShortestTimeout{1};
// The longest time-out. Larger durations could overflow the clock's time points.
constexpr std::chrono::milliseconds kLongestTimeout = std::chrono::hours(24 * 365);

std::chrono::milliseconds bounded(std::chrono::milliseconds timeout) {
  return std::clamp(timeout, kShortestTimeout, kLongestTimeout);
}

template <typename T>
Result<T> failed(Failure failure) {
  return {std::nullopt, std::move(failure)};
}

Failure senseless() {
  return {Failure::Kind::kRefused, "", "the answer of the service does not have the expected type"};
}
Failure timedOut() { return {Failure::Kind::kTimedOut, "", "no answer from the service in time"}; }
Failure ended() { return {Failure::Kind::kNoService, "", "the service ended the connection"}; }

// A copy of a frame that answers a call.
struct Reply {
  bool isError = false;
  std::string frame;

  [[nodiscard]] dbus::Frame read() const {
    const auto frameOrError = dbus::readFrame(std::as_bytes(std::span(frame)));
    const auto* valid = std::get_if<dbus::Frame>(&frameOrError);
    return valid != nullptr ? *valid : dbus::Frame{};
  }
  // If the answer has exactly one value, of that signature, returns the value; otherwise
  // std::nullopt.
  [[nodiscard]] std::optional<Value> value(std::string_view signature) const {
    std::vector<Value> values;
    if (dbus::decodeBody(read(), signature, values) || values.size() != 1) return std::nullopt;
    return std::move(values.front());
  }
};

Failure failureFromError(const Reply& reply) {
  const dbus::Frame frame = reply.read();
  // The text of an error is optional, and other values may follow it.
  std::vector<Value> values;
  const bool hasText = frame.header.signature.starts_with('s') &&
                       !dbus::decodeBody(frame, frame.header.signature, values) && !values.empty();
  return {Failure::Kind::kRefused, std::string(frame.header.errorName),
          hasText ? std::string(values.front().string()) : "the service gave no reason"};
}

Result<bool> readBool(const Reply& reply) {
  if (reply.isError) return failed<bool>(failureFromError(reply));
  const auto value = reply.value("b");
  if (!value) return failed<bool>(senseless());
  return {value->toBool(), std::nullopt};
}

Result<Dictionary> readDictionary(Result<Reply>&& reply) {
  if (!reply) return failed<Dictionary>(std::move(*reply.failure));
  const auto value = reply.value->value("a{sv}");
  if (!value) return failed<Dictionary>(senseless());
  return {value->dictionary(), std::nullopt};
}

// The answer to a start, which comes when the session is stopped.
struct HeldReply {
  std::uint32_t serial = 0;
  std::optional<Result<bool>> answer;
};

}  // namespace

class HalvoxConnection::Impl {
 public:
  Impl(ConnectedStream connected, std::chrono::milliseconds timeout)
      : connected_(std::move(connected)), timeout_(bounded(timeout)) {}

  [[nodiscard]] const std::string& place() const { return connected_.place; }
  [[nodiscard]] const std::vector<TriedPlace>& passedOver() const { return connected_.passedOver; }
  [[nodiscard]] bool isReady() const { return connected_.stream.isReady(); }
  [[nodiscard]] bool isOpen() const { return connected_.stream.isOpen(); }
  [[nodiscard]] Deadline deadline() const { return std::chrono::steady_clock::now() + timeout_; }

  // Waits until bytes arrive or the deadline passes, and handles the bytes. Returns 0 or a negative
  // errno: -ECONNRESET if the connection has ended, -ETIMEDOUT after the deadline.
  int processUntil(Deadline deadline) {
    ServiceStream& stream = connected_.stream;
    if (!stream.isOpen() || !stream.send()) return -ECONNRESET;
    if (std::chrono::steady_clock::now() >= deadline) return -ETIMEDOUT;
    pollfd polled = stream.polled(POLLIN);
    if (!pollUntil({&polled, 1}, deadline)) return 0;
    const bool alive = (polled.revents & ~POLLOUT) == 0 || stream.receive();
    if (stream.isReady()) takeReplies();
    return alive && stream.isOpen() ? 0 : -ECONNRESET;
  }

  // Gives a frame the next serial and appends it to the output. Returns the serial.
  std::uint32_t post(std::string&& frame) {
    if (++lastSerial_ == 0) ++lastSerial_;
    setSerial(frame.data(), lastSerial_);
    connected_.stream.append(frame);
    return lastSerial_;
  }

  Result<Reply> ask(Request&& request) {
    if (auto* failure = std::get_if<Failure>(&request)) return failed<Reply>(std::move(*failure));
    if (!isOpen()) return failed<Reply>(ended());
    awaited_ = post(std::move(std::get<std::string>(request)));
    reply_.reset();
    const Deadline end = deadline();
    int result = 0;
    while (!reply_ && result == 0) result = processUntil(end);
    awaited_ = 0;
    if (!reply_) return failed<Reply>(result == -ETIMEDOUT ? timedOut() : ended());
    Reply reply = std::move(*reply_);
    if (reply.isError) return failed<Reply>(failureFromError(reply));
    return {std::move(reply), std::nullopt};
  }

  Result<bool> askBool(Request&& request) {
    auto answer = ask(std::move(request));
    if (!answer) return failed<bool>(std::move(*answer.failure));
    return readBool(*answer.value);
  }

  std::map<ReporterID, HeldReply>& heldReplies() { return heldReplies_; }

 private:
  void takeReplies() {
    for (;;) {
      const NextFrame next = nextFrame(connected_.stream.input());
      if (next.state == NextFrame::State::kIncomplete) return;
      if (next.state == NextFrame::State::kBroken) {
        connected_.stream.end();
        return;
      }
      if (next.state == NextFrame::State::kAnswer) onAnswer(next.answer);
      connected_.stream.consume(next.bytes);
    }
  }

  void onAnswer(const Answer& answer) {
    Reply reply{answer.isError, std::string(reinterpret_cast<const char*>(answer.frame.data()),
                                            answer.frame.size())};
    if (answer.replySerial == awaited_) {
      reply_ = std::move(reply);
      return;
    }
    for (auto& [id, held] : heldReplies_) {
      if (held.serial == answer.replySerial) held.answer = readBool(reply);
    }
  }

  ConnectedStream connected_;
  std::chrono::milliseconds timeout_;
  std::uint32_t lastSerial_ = 0;
  std::uint32_t awaited_ = 0;  // the serial of the call that ask() waits for; 0: none
  std::optional<Reply> reply_;
  std::map<ReporterID, HeldReply> heldReplies_;
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
  auto impl = std::make_unique<Impl>(std::move(std::get<ConnectedStream>(connected)), timeout);
  const Deadline deadline = impl->deadline();
  while (!impl->isReady()) {
    if (const int result = impl->processUntil(deadline); result < 0) {
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
  return impl_->askBool(makeRequest(SessionOperation{id, CreateSession{}}));
}

Result<bool> HalvoxConnection::setServiceType(ServiceType type, ReporterID id) {
  return impl_->askBool(makeRequest(SessionOperation{id, type}));
}

Result<ServiceType> HalvoxConnection::getServiceNameForReporterID(ReporterID id) {
  auto answer = impl_->ask(makeRequest("getServiceNameForReporterID", id));
  if (!answer) return failed<ServiceType>(std::move(*answer.failure));
  const auto type = answer.value->value("q");
  if (!type) return failed<ServiceType>(senseless());
  return {static_cast<ServiceType>(type->toUInt64()), std::nullopt};
}

Result<bool> HalvoxConnection::setConfiguration(const Dictionary& configuration, ReporterID id) {
  return impl_->askBool(makeRequest(SessionOperation{id, configuration}));
}

Result<bool> HalvoxConnection::startReportingSessionForID(ReporterID id) {
  Request request = makeRequest(SessionOperation{id, StartSession{}});
  if (auto* failure = std::get_if<Failure>(&request)) return failed<bool>(std::move(*failure));
  if (!impl_->isOpen()) return failed<bool>(ended());
  HeldReply& reply = impl_->heldReplies()[id];
  reply = {.serial = impl_->post(std::move(std::get<std::string>(request))), .answer = {}};

  // The service carries out requests in order, and answers this query after it has carried out the
  // start. If it refuses the start, the error has arrived by then.
  auto query = impl_->ask(makeRequest("reporterIDValid", id));
  if (!query) return failed<bool>(std::move(*query.failure));
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
  const HeldReply& held = found->second;
  int result = 0;
  while (!held.answer && result == 0) result = impl_->processUntil(deadline);
  if (!held.answer) return failed<bool>(result == -ETIMEDOUT ? timedOut() : ended());
  return *held.answer;
}

Result<bool> HalvoxConnection::sendMessage(const Dictionary& message, Category category,
                                           EventType type,
                                           const std::optional<std::vector<ReporterID>>& ids) {
  auto answer = impl_->ask(makeRequest(MessageView{ids, message, category, type}));
  if (!answer) return failed<bool>(std::move(*answer.failure));
  return {true, std::nullopt};
}

Result<bool> HalvoxConnection::stopReportingSessionForID(ReporterID id) {
  return impl_->askBool(makeRequest(SessionOperation{id, StopSession{}}));
}

Result<bool> HalvoxConnection::destroyReportingSession(ReporterID id) {
  return impl_->askBool(makeRequest(SessionOperation{id, DestroySession{}}));
}

Result<Dictionary> HalvoxConnection::reporterIDValid(ReporterID id) {
  return readDictionary(impl_->ask(makeRequest("reporterIDValid", id)));
}

Result<Dictionary> HalvoxConnection::getCounters() {
  return readDictionary(impl_->ask(makeCountersRequest()));
}

Result<bool> HalvoxConnection::beginVacuum(const Dictionary& options) {
  auto answer = impl_->ask(makeBeginVacuumRequest(options));
  if (!answer) return failed<bool>(std::move(*answer.failure));
  return {true, std::nullopt};
}

Result<Dictionary> HalvoxConnection::vacuumState() {
  return readDictionary(impl_->ask(makeVacuumStateRequest()));
}

Result<bool> HalvoxConnection::beginErase(const Dictionary& options) {
  auto answer = impl_->ask(makeBeginEraseRequest(options));
  if (!answer) return failed<bool>(std::move(*answer.failure));
  return {true, std::nullopt};
}

Result<Dictionary> HalvoxConnection::eraseState() {
  return readDictionary(impl_->ask(makeEraseStateRequest()));
}

Result<std::vector<ReporterID>> HalvoxConnection::getAllReporters() {
  using IDs = std::vector<ReporterID>;
  auto answer = impl_->ask(makeRequest("getAllReporters"));
  if (!answer) return failed<IDs>(std::move(*answer.failure));
  const auto value = answer.value->value("ax");
  if (!value) return failed<IDs>(senseless());
  IDs ids;
  for (const Value& id : value->array()) ids.push_back(id.toInt64());
  return {std::move(ids), std::nullopt};
}

Result<bool> HalvoxConnection::killService() {
  const auto answer = impl_->ask(makeRequest("killService"));
  if (answer) return failed<bool>(senseless());
  if (answer.failure->kind == Failure::Kind::kNoService) return {true, std::nullopt};
  return failed<bool>(*answer.failure);
}

}  // namespace halvox::client
