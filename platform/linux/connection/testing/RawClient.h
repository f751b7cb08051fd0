#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/wire/Frame.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// A received message, with its texts in its own storage.
struct RawAnswer {
  dbus::MessageType type = dbus::MessageType::kMethodReturn;
  std::uint32_t replySerial = 0;
  std::string errorName;
  std::vector<Value> values;  // of the types in the message's signature
};

// A client that can send any bytes, to test what proper clients never send. A read waits for at
// most kTestDeadline.
class RawClient {
 public:
  explicit RawClient(const std::filesystem::path& socket);

  // Sends the handshake and the bytes that follow it in one write.
  void authenticate(std::string_view withMore = {});
  // Sends everything, and waits while the socket is full.
  void send(std::string_view bytes);
  // Sends what the socket takes without waiting. Returns the number of bytes.
  std::size_t trySend(std::string_view bytes);
  // Returns the next message; std::nullopt if the connection is closed or nothing arrives in time.
  std::optional<RawAnswer> receive();
  // Returns true if the service closes the connection.
  bool isClosedByService();
  void close() { fd_.reset(); }
  [[nodiscard]] int fd() const { return fd_.get(); }

  // Returns a call of the test's object. The serials are 1, 2, ...
  std::string call(std::string_view member, std::string_view signature = "",
                   std::span<const Value> arguments = {});
  std::string callWithText(std::string_view member, std::string_view text);
  [[nodiscard]] std::uint32_t lastSerial() const { return serial_; }

 private:
  // Returns false if nothing more arrives.
  bool receiveMore();

  UniqueFd fd_;
  std::string input_;
  std::size_t used_ = 0;  // of the input
  std::uint32_t serial_ = 0;
  bool awaitsHandshake_ = false;
};

// Returns the same call with the flag that no reply is expected.
std::string withoutReply(std::string call);

}  // namespace halvox::platform::linux_
