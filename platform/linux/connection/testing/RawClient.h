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

// A message that came back, with its texts in its own storage.
struct RawAnswer {
  dbus::MessageType type = dbus::MessageType::kMethodReturn;
  std::uint32_t replySerial = 0;
  std::string errorName;
  std::vector<Value> values;  // of the signature that the message has
};

// A client made of bytes, for what proper clients never do. Reads wait for kTestDeadline at most.
class RawClient {
 public:
  explicit RawClient(const std::filesystem::path& socket);

  // The handshake, in one go with what follows it.
  void authenticate(std::string_view withMore = {});
  // Sends all, waiting for room.
  void send(std::string_view bytes);
  // Sends what the socket takes without waiting; returns how much that was.
  std::size_t trySend(std::string_view bytes);
  // The next message; none when the connection is closed or nothing comes.
  std::optional<RawAnswer> receive();
  // True when the service closes the connection.
  bool isClosedByService();
  void close() { fd_.reset(); }
  [[nodiscard]] int fd() const { return fd_.get(); }

  // A call of the test's object. Serials count 1, 2, ...
  std::string call(std::string_view member, std::string_view signature = "",
                   std::span<const Value> arguments = {});
  std::string callWithText(std::string_view member, std::string_view text);
  [[nodiscard]] std::uint32_t lastSerial() const { return serial_; }

 private:
  // False when nothing more comes.
  bool receiveMore();

  UniqueFd fd_;
  std::string input_;
  std::size_t used_ = 0;  // of the input
  std::uint32_t serial_ = 0;
  bool awaitsHandshake_ = false;
};

// The same call without the wish for an answer.
std::string withoutReply(std::string call);

}  // namespace halvox::platform::linux_
