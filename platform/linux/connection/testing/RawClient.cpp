#include "platform/linux/connection/testing/RawClient.h"

#include <array>
#include <cerrno>
#include <stdexcept>
#include <variant>

#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/connection/testing/ServiceUnderTest.h"
#include "platform/linux/connection/testing/TestInterface.h"
#include "platform/linux/connection/wire/FrameWriter.h"
#include "platform/linux/connection/wire/ValueDecoder.h"

namespace halvox::platform::linux_ {
namespace {

std::span<const std::byte> bytesOf(std::string_view text) {
  return std::as_bytes(std::span(text.data(), text.size()));
}

}  // namespace

RawClient::RawClient(const std::filesystem::path& socketPath)
    : fd_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  socketPath.native().copy(address.sun_path, sizeof address.sun_path - 1);
  timeval timeout{.tv_sec = kTestDeadline.count(), .tv_usec = 0};
  setsockopt(fd_.get(), SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
  setsockopt(fd_.get(), SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof timeout);
  if (connect(fd_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    throw std::runtime_error("connect: " + errnoText(errno));
  }
}

void RawClient::authenticate(std::string_view withMore) {
  std::string bytes(1, '\0');
  bytes += "AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n";
  bytes += withMore;
  awaitsHandshake_ = true;
  send(bytes);
}

void RawClient::send(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::send(fd_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (count < 0) throw std::runtime_error("send: " + errnoText(errno));
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
}

std::size_t RawClient::trySend(std::string_view bytes) {
  const ssize_t count = ::send(fd_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
  return count > 0 ? static_cast<std::size_t>(count) : 0;
}

bool RawClient::receiveMore() {
  std::array<char, 65536> buffer;
  const ssize_t count = recv(fd_.get(), buffer.data(), buffer.size(), 0);
  if (count <= 0) return false;
  input_.erase(0, used_);
  used_ = 0;
  input_.append(buffer.data(), static_cast<std::size_t>(count));
  return true;
}

std::optional<RawAnswer> RawClient::receive() {
  while (awaitsHandshake_) {
    const std::size_t start = input_.find("OK ");
    const std::size_t end = start == std::string::npos ? start : input_.find("\r\n", start);
    if (end != std::string::npos) {
      input_.erase(0, end + 2);
      awaitsHandshake_ = false;
    } else if (!receiveMore()) {
      return std::nullopt;
    }
  }
  while (true) {
    const std::string_view unused = std::string_view(input_).substr(used_);
    const dbus::FrameMeasure measure = dbus::measureFrame(bytesOf(unused), dbus::kMaxMessageBytes);
    if (measure.state == dbus::FrameMeasure::State::kKnown && unused.size() >= measure.totalBytes) {
      const std::string bytes(unused.substr(0, measure.totalBytes));
      used_ += measure.totalBytes;
      const auto read = dbus::readFrame(bytesOf(bytes));
      const auto& frame = std::get<dbus::Frame>(read);
      RawAnswer answer{.type = frame.header.type,
                       .replySerial = frame.header.replySerial,
                       .errorName = std::string(frame.header.errorName),
                       .values = {}};
      if (dbus::decodeBody(frame, frame.header.signature, answer.values).has_value()) {
        throw std::runtime_error("an answer that cannot be decoded");
      }
      return answer;
    }
    if (!receiveMore()) return std::nullopt;
  }
}

bool RawClient::isClosedByService() {
  std::array<char, 4096> buffer;
  while (true) {
    const ssize_t count = recv(fd_.get(), buffer.data(), buffer.size(), 0);
    if (count > 0) continue;
    return count == 0 || errno == ECONNRESET;
  }
}

std::string RawClient::call(std::string_view member, std::string_view signature,
                            std::span<const Value> arguments) {
  std::string bytes;
  const dbus::CallTarget target{
      .destination = "", .path = kTestPath, .interface = kTestInterface, .member = member};
  if (!dbus::appendMethodCall(bytes, ++serial_, target, signature, arguments)) {
    throw std::runtime_error("a call that cannot be written");
  }
  return bytes;
}

std::string RawClient::callWithText(std::string_view member, std::string_view text) {
  const std::array arguments = {Value(text)};
  return call(member, "s", arguments);
}

std::string withoutReply(std::string call) {
  constexpr std::size_t kFlags = 2;
  call[kFlags] = static_cast<char>(call[kFlags] | static_cast<char>(dbus::kNoReplyExpected));
  return call;
}

}  // namespace halvox::platform::linux_
