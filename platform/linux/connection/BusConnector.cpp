#include "platform/linux/connection/BusConnector.h"

#include <cerrno>
#include <cstring>
#include <utility>

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/connection/BusNames.h"
#include "platform/linux/connection/wire/FrameWriter.h"
#include "platform/linux/connection/wire/Handshake.h"
#include "platform/linux/connection/wire/ValueDecoder.h"

namespace halvox::platform::linux_ {
namespace {

// How long a bus may take to answer. A local bus answers within milliseconds, and a broken bus must
// not hang the start of the service.
constexpr std::chrono::seconds kBusTimeout{5};
constexpr std::uint32_t kDoNotQueue = 4;    // flag of RequestName: fail if the name is taken
constexpr std::uint32_t kPrimaryOwner = 1;  // answers of RequestName
constexpr std::uint32_t kAlreadyOwner = 4;
// Matches the signal that a name has lost its owner. `arg2` is the new owner, which is empty if
// there is none.
constexpr std::string_view kVanishingNames =
    "type='signal',sender='org.freedesktop.DBus',interface='org.freedesktop.DBus',"
    "member='NameOwnerChanged',path='/org/freedesktop/DBus',arg2=''";

Result<UniqueFd> connectTo(const BusSocket& bus) {
  const auto failure = [&](int error) { return Failure<>{bus.name + ": " + errnoText(error)}; };
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::size_t start = bus.space == BusSocket::Space::kAbstract ? 1 : 0;
  if (bus.name.size() + start >= sizeof address.sun_path) return failure(ENAMETOOLONG);
  std::memcpy(&address.sun_path[start], bus.name.data(), bus.name.size());
  // An abstract name has a NUL in front, a file path has one at its end. In both cases the address
  // is one byte longer than the name.
  const std::size_t length = offsetof(sockaddr_un, sun_path) + bus.name.size() + 1;
  UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
  if (!fd) return failure(errno);
  const auto* generic = reinterpret_cast<const sockaddr*>(&address);
  if (::connect(fd.get(), generic, static_cast<socklen_t>(length)) != 0) {
    return failure(errno);
  }
  return fd;
}

}  // namespace

BusConnector::BusConnector(std::string busName)
    : busName_(std::move(busName)), input_(dbus::kMaxMessageBytes) {}

Result<BusSession, ConnectionOpenError> BusConnector::connect(const std::string& address) {
  // Use one deadline for all steps. With a deadline for each step, a bus that answers every step
  // slowly could delay the start for long.
  deadline_ = std::chrono::steady_clock::now() + kBusTimeout;
  if (Outcome done = connectToFirst(address); !done) return std::move(done).error();
  if (Outcome done = authenticate(); !done) return std::move(done).error();
  const auto ignore = [](const Value&) -> Outcome { return {}; };
  if (Outcome done = call("Hello", "", {}, "s", ignore); !done) return std::move(done).error();
  const std::array rule = {Value(kVanishingNames)};
  // Ask for these signals before asking for the name. Once the service owns the name, a sender can
  // call it and leave, and the service must not miss the signal that the sender has left.
  if (Outcome done = call("AddMatch", "s", rule, "", ignore); !done) return std::move(done).error();
  if (Outcome done = requestName(); !done) return std::move(done).error();
  const std::span<const std::byte> rest = input_.unused();
  // The rest may be requests that arrived right after the service got the name.
  kept_.insert(kept_.end(), rest.begin(), rest.end());
  return BusSession{.fd = std::move(fd_), .unused = std::move(kept_), .lastSerial = lastSerial_};
}

BusConnector::Outcome BusConnector::connectToFirst(const std::string& address) {
  address_ = address;
  std::string reasons;
  // An address may list several sockets. Use the first one that accepts the connection. If none
  // does, the error has the reasons of all attempts, because any of them may be the cause.
  for (const BusSocket& socket : parseBusAddress(address)) {
    Result<UniqueFd> connected = connectTo(socket);
    if (connected) {
      fd_ = *std::move(connected);
      return {};
    }
    reasons += (reasons.empty() ? "" : "; ") + connected.error().message;
  }
  return unreachable(
      reasons.empty()
          ? "the address does not contain a Unix socket (unix:path=... or unix:abstract=...)"
          : reasons);
}

BusConnector::Outcome BusConnector::authenticate() {
  dbus::ClientHandshake handshake(geteuid());
  std::string output;
  handshake.start(output);
  while (true) {
    if (Outcome done = send(output); !done) return done;
    output.clear();
    if (Outcome done = receive(); !done) return done;
    const dbus::HandshakeProgress progress = handshake.feed(input_.unused(), output);
    input_.consume(progress.consumedBytes);
    input_.settle();
    switch (progress.state) {
      case dbus::HandshakeState::kContinue:
        break;
      case dbus::HandshakeState::kDone:
        // D-Bus requires the line BEGIN, which is in `output`, before the first message.
        return send(output);
      case dbus::HandshakeState::kFailed:
        return unreachable("the handshake failed: " + progress.error);
    }
  }
}

BusConnector::Outcome BusConnector::requestName() {
  const std::array arguments = {Value(busName_), Value(kDoNotQueue)};
  return call("RequestName", "su", arguments, "u", [this](const Value& answer) -> Outcome {
    const std::uint64_t owner = answer.toUInt64();
    if (owner == kPrimaryOwner || owner == kAlreadyOwner) return {};
    return Failure<ConnectionOpenError>{.code = ConnectionOpenError::kBusNameTaken,
                                        .message = "bus " + address_ +
                                                   ": another process owns the name " + busName_ +
                                                   "; stop it or change listener.bus"};
  });
}

BusConnector::Outcome BusConnector::call(std::string_view member, std::string_view signature,
                                         std::span<const Value> arguments,
                                         std::string_view answerSignature,
                                         const std::function<Outcome(const Value&)>& take) {
  const dbus::CallTarget target{.destination = bus_names::kBus,
                                .path = bus_names::kBusPath,
                                .interface = bus_names::kBus,
                                .member = member};
  std::string bytes;
  if (!dbus::appendMethodCall(bytes, ++lastSerial_, target, signature, arguments)) {
    return unreachable("cannot encode the call of " + std::string(member));
  }
  if (Outcome done = send(bytes); !done) return done;
  auto answer = waitForAnswer(lastSerial_);
  if (!answer) return std::move(answer).error();
  const dbus::Frame& frame = *answer;
  if (frame.header.type == dbus::MessageType::kError) {
    return unreachable(std::string(member) + " failed with " + std::string(frame.header.errorName));
  }
  std::vector<Value> values;
  if (dbus::decodeBody(frame, answerSignature, values).has_value()) {
    return unreachable("the answer to " + std::string(member) + " has the signature \"" +
                       std::string(frame.header.signature) + "\", expected \"" +
                       std::string(answerSignature) + "\"");
  }
  return take(values.empty() ? Value() : values.front());
}

Result<dbus::Frame, ConnectionOpenError> BusConnector::waitForAnswer(std::uint32_t serial) {
  while (true) {
    const FrameBuffer::Next next = input_.next();
    if (next.state == FrameBuffer::State::kBroken) return unreachable(next.error.message);
    if (next.state != FrameBuffer::State::kFrame) {
      if (Outcome done = receive(); !done) return std::move(done).error();
      input_.settle();
      continue;
    }
    // Copy the frame: the result points into it, and consume() may overwrite the original.
    answer_.assign(next.bytes.begin(), next.bytes.end());
    input_.consume(next.totalBytes);
    std::variant<dbus::Frame, dbus::WireError> read = dbus::readFrame(answer_);
    if (auto* error = std::get_if<dbus::WireError>(&read); error != nullptr) {
      return unreachable(error->message);
    }
    const dbus::Frame& frame = std::get<dbus::Frame>(read);
    if (frame.header.replySerial == serial) return frame;
    // This message is a signal or an early request. BusConnection handles it later.
    kept_.insert(kept_.end(), answer_.begin(), answer_.end());
  }
}

BusConnector::Outcome BusConnector::send(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::send(fd_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (count >= 0) {
      bytes.remove_prefix(static_cast<std::size_t>(count));
    } else if (errno != EAGAIN && errno != EINTR) {
      return unreachable(errnoText(errno));
    } else if (!waitFor(POLLOUT)) {
      return unreachable("no answer within 5 seconds");
    }
  }
  return {};
}

BusConnector::Outcome BusConnector::receive() {
  if (!waitFor(POLLIN)) return unreachable("no answer within 5 seconds");
  const std::span<std::byte> room = input_.readInto(scratch_);
  const ssize_t count = read(fd_.get(), room.data(), room.size());
  const int error = errno;
  input_.received(count > 0 ? static_cast<std::size_t>(count) : 0);
  if (count == 0) return unreachable("the bus closed the connection");
  if (count < 0 && error != EAGAIN && error != EINTR) return unreachable(errnoText(error));
  return {};
}

bool BusConnector::waitFor(short events) const {
  using std::chrono::milliseconds;
  const auto left = std::chrono::ceil<milliseconds>(deadline_ - std::chrono::steady_clock::now());
  if (left.count() <= 0) return false;
  pollfd waiting{.fd = fd_.get(), .events = events, .revents = 0};
  const int result = poll(&waiting, 1, static_cast<int>(left.count()));
  return result > 0 || (result < 0 && errno == EINTR);
}

Failure<ConnectionOpenError> BusConnector::unreachable(const std::string& why) const {
  return {.code = ConnectionOpenError::kBusUnreachable, .message = "bus " + address_ + ": " + why};
}

}  // namespace halvox::platform::linux_
