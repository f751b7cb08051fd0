#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Result.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/BusAddress.h"
#include "platform/linux/connection/FrameBuffer.h"
#include "platform/linux/connection/LinuxConnectionService.h"
#include "platform/linux/connection/wire/Frame.h"

namespace halvox::platform::linux_ {

// A connection to a bus, on which the service owns its well-known name.
struct BusSession {
  UniqueFd fd;                    // non-blocking
  std::vector<std::byte> unused;  // other messages that arrived, to be handled next
  std::uint32_t lastSerial = 0;
};

// Connects to a bus: performs the handshake, sends Hello, adds a match rule for senders that leave,
// and requests the service's name. One object connects once. Blocks the calling thread for at most
// kBusTimeout (5 s) in all, and is therefore used only before the service accepts clients. The
// error of a failure names the address and the reason.
class BusConnector {
 public:
  explicit BusConnector(std::string busName);
  BusConnector(const BusConnector&) = delete;
  BusConnector& operator=(const BusConnector&) = delete;

  Result<BusSession, ConnectionOpenError> connect(const std::string& address);

 private:
  using Outcome = Result<void, ConnectionOpenError>;

  Outcome connectToFirst(const std::string& address);
  Outcome authenticate();
  Outcome requestName();
  // Calls a method of the bus and passes the first argument of the answer to `take`.
  Outcome call(std::string_view member, std::string_view signature,
               std::span<const Value> arguments, std::string_view answerSignature,
               const std::function<Outcome(const Value&)>& take);
  // Waits for the answer to the call with that serial. Stores all other messages for
  // BusSession::unused.
  Result<dbus::Frame, ConnectionOpenError> waitForAnswer(std::uint32_t serial);
  Outcome send(std::string_view bytes);
  Outcome receive();
  [[nodiscard]] bool waitFor(short events) const;
  [[nodiscard]] Failure<ConnectionOpenError> unreachable(const std::string& why) const;

  std::string busName_;
  std::string address_;
  UniqueFd fd_;
  ReadScratch scratch_;
  FrameBuffer input_;
  std::vector<std::byte> answer_;  // the frame that waitForAnswer() found
  std::vector<std::byte> kept_;
  std::uint32_t lastSerial_ = 0;
  std::chrono::steady_clock::time_point deadline_;
};

}  // namespace halvox::platform::linux_
