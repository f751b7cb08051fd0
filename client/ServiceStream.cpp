#include "client/ServiceStream.h"

#include <algorithm>
#include <bit>
#include <cerrno>
#include <cstring>
#include <utility>

#include <sys/socket.h>
#include <sys/un.h>

#include "platform/linux/connection/wire/EndedSignal.h"
#include "platform/linux/connection/wire/HeaderFields.h"

namespace halvox::client {
namespace {

namespace dbus = platform::linux_::dbus;
using platform::linux_::UniqueFd;

constexpr std::size_t kReadBytes = std::size_t{16} * 1024;
// All lines of our side, sent at once. The service reads the later ones after it has agreed. The
// identity is omitted, because the service takes it from the socket, and because inside a user
// namespace it would be a different one than outside.
constexpr std::string_view kHandshake{"\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n", 29};

// Connects a non-blocking stream to a socket. After a failure the second member is the errno.
std::pair<UniqueFd, int> connectSocket(const std::string& socketPath) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (socketPath.size() >= sizeof address.sun_path) return {UniqueFd(), ENAMETOOLONG};
  std::memcpy(address.sun_path, socketPath.data(), socketPath.size());

  UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!fd) return {UniqueFd(), errno};
  // If the backlog is full, connect() fails with EAGAIN. A stalled service therefore does not block
  // the caller.
  if (connect(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) < 0) {
    return {UniqueFd(), errno};
  }
  return {std::move(fd), 0};
}

bool isTransient(int error) { return error == EAGAIN || error == EINTR; }

std::uint32_t numberAt(std::span<const std::byte> bytes, std::size_t offset) {
  std::uint32_t number = 0;
  std::memcpy(&number, bytes.data() + offset, sizeof number);
  return number;
}

// Recognises an answer without an error that begins like the answers of the service: in the byte
// order of this machine, and with the serial of the call as the first field. Returns false for any
// other frame.
bool readPlainAnswer(std::span<const std::byte> input, NextFrame& next) {
  constexpr std::size_t kFieldsStart = dbus::kFrameStartBytes;
  constexpr std::size_t kReplySerialEnd = kFieldsStart + 8;
  constexpr char kByteOrder = std::endian::native == std::endian::little ? 'l' : 'B';
  constexpr char kFirstField[4] = {static_cast<char>(dbus::HeaderField::kReplySerial), 1, 'u', 0};
  if (input.size() < kReplySerialEnd) return false;
  if (std::to_integer<char>(input[0]) != kByteOrder ||
      static_cast<dbus::MessageType>(input[dbus::kTypeOffset]) !=
          dbus::MessageType::kMethodReturn ||
      std::to_integer<std::uint8_t>(input[dbus::kVersionOffset]) != dbus::kProtocolVersion ||
      std::memcmp(input.data() + kFieldsStart, kFirstField, sizeof kFirstField) != 0) {
    return false;
  }
  const std::size_t fields = numberAt(input, dbus::kFieldsLengthOffset);
  const std::size_t body = numberAt(input, dbus::kBodyLengthOffset);
  const std::size_t total = ((kFieldsStart + fields + 7) & ~std::size_t{7}) + body;
  if (fields < 8 || total > input.size()) return false;
  next.state = NextFrame::State::kAnswer;
  next.bytes = total;
  next.answer = {numberAt(input, kFieldsStart + 4), false, input.first(total)};
  return next.answer.replySerial != 0;
}

}  // namespace

ServiceStream::ServiceStream(UniqueFd connected)
    : fd_(std::move(connected)), output_(kHandshake), input_(kReadBytes) {}

char* ServiceStream::append(std::size_t size) {
  if (sent_ == output_.size()) {
    output_.clear();
    sent_ = 0;
  }
  const std::size_t start = output_.size();
  output_.resize(start + size);
  return output_.data() + start;
}

bool ServiceStream::send() {
  while (!ended_ && hasOutput()) {
    const ssize_t size =
        ::send(fd_.get(), output_.data() + sent_, output_.size() - sent_, MSG_NOSIGNAL);
    if (size >= 0) {
      sent_ += static_cast<std::size_t>(size);
    } else if (errno == EAGAIN) {
      break;
    } else if (errno != EINTR) {
      ended_ = true;
    }
  }
  return isOpen();
}

bool ServiceStream::receive() {
  readInput();
  if (!ready_) continueHandshake();
  return isOpen();
}

bool ServiceStream::receiveRest() { return fd_ && readInput(); }

// Returns true if bytes have come.
bool ServiceStream::readInput() {
  if (consumed_ == filled_) {
    consumed_ = filled_ = 0;
  } else if (consumed_ > 0) {
    std::memmove(input_.data(), input_.data() + consumed_, filled_ - consumed_);
    filled_ -= std::exchange(consumed_, 0);
  }
  if (filled_ == input_.size()) input_.resize(2 * input_.size());
  const ssize_t size = recv(fd_.get(), input_.data() + filled_, input_.size() - filled_, 0);
  if (size > 0) filled_ += static_cast<std::size_t>(size);
  if (size == 0 || (size < 0 && !isTransient(errno))) ended_ = true;
  return size > 0;
}

// The service first asks for the identity with the line "DATA", and then agrees with "OK". The
// client has sent its answer to "DATA" already.
void ServiceStream::continueHandshake() {
  auto rest = input();
  while (!ready_ && line_.take(rest)) {
    if (line_.text().starts_with("OK ")) {
      ready_ = true;
    } else if (line_.text() != "DATA") {
      ended_ = true;
      return;
    }
  }
  if (line_.isTooLong()) ended_ = true;
  consumed_ = filled_ - rest.size();
}

std::span<const std::byte> ServiceStream::input() const {
  return std::span(input_).subspan(consumed_, filled_ - consumed_);
}

std::variant<ConnectedStream, Failure> connectToService(const std::vector<std::string>& places) {
  std::vector<TriedPlace> tried;
  for (const std::string& place : places) {
    auto [fd, error] = connectSocket(place);
    if (error == 0) {
      return ConnectedStream{ServiceStream(std::move(fd)), place, std::move(tried)};
    }
    tried.push_back({place, error});
    if (!meansAbsence(error)) break;
  }
  return Failure{Failure::Kind::kNoService, "", describeTried("service", tried)};
}

NextFrame nextFrame(std::span<const std::byte> input) {
  NextFrame next;
  if (readPlainAnswer(input, next)) return next;
  next = {};
  const dbus::FrameMeasure measure = dbus::measureFrame(input, dbus::kMaxMessageBytes);
  if (measure.state == dbus::FrameMeasure::State::kBroken) next.state = NextFrame::State::kBroken;
  if (measure.state != dbus::FrameMeasure::State::kKnown || measure.totalBytes > input.size()) {
    return next;
  }
  next.bytes = measure.totalBytes;
  const auto bytes = input.first(measure.totalBytes);
  const auto frame = dbus::readFrame(bytes);
  if (std::holds_alternative<dbus::WireError>(frame)) {
    next.state = NextFrame::State::kBroken;
    return next;
  }
  const dbus::MessageHeader& header = std::get<dbus::Frame>(frame).header;
  const bool isError = header.type == dbus::MessageType::kError;
  const bool isAnswer = isError || header.type == dbus::MessageType::kMethodReturn;
  next.state = isAnswer ? NextFrame::State::kAnswer : NextFrame::State::kOther;
  next.answer = {header.replySerial, isError, bytes};
  if (const auto lastRequest = dbus::readEndedSignal(std::get<dbus::Frame>(frame))) {
    next.state = NextFrame::State::kEnded;
    next.lastRequest = *lastRequest;
  }
  return next;
}

}  // namespace halvox::client
