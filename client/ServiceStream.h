#pragma once

#include <cstddef>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include <poll.h>

#include "client/HalvoxClient.h"
#include "client/ServicePlaces.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/Handshake.h"

namespace halvox::client {

// A connection to the service's socket: the handshake, then frames in both directions. Never
// blocks.
//
//   closed ──connectToService()──► handshake ──► ready ──► ended
//                                      └───────────────────▲
//
// Once it is ready, the owner appends frames and calls send() to write everything that has gathered
// in one system call. (Some servers overlook frames that arrive in one piece with the end of the
// handshake.) receive() reads what has arrived; the owner then takes frames out of input(). Both
// return false once the connection has ended. Belongs to one thread at a time.
class ServiceStream {
 public:
  ServiceStream() = default;
  explicit ServiceStream(platform::linux_::UniqueFd connected);

  [[nodiscard]] bool isOpen() const { return static_cast<bool>(fd_) && !ended_; }
  // Returns true once the service has agreed to the handshake.
  [[nodiscard]] bool isReady() const { return ready_; }
  // Returns the argument for poll(2): waits for `events`, and for POLLOUT while output is unsent.
  [[nodiscard]] pollfd polled(short events) const {
    return {fd_.get(), static_cast<short>(hasOutput() ? events | POLLOUT : events), 0};
  }
  // True while appended bytes wait for send(), or for the socket to become writable.
  [[nodiscard]] bool hasOutput() const { return sent_ < output_.size(); }
  [[nodiscard]] std::size_t outputBytes() const { return output_.size() - sent_; }

  // Appends room for `size` bytes of frames, and returns it.
  char* append(std::size_t size);
  void append(std::string_view frame) { frame.copy(append(frame.size()), frame.size()); }
  bool send();
  bool receive();
  // Ends the connection from this side, without closing the socket yet.
  void end() { ended_ = true; }

  // Returns the bytes that were received and not yet consumed. They begin with a frame once the
  // handshake is done.
  [[nodiscard]] std::span<const std::byte> input() const;
  void consume(std::size_t bytes) { consumed_ += bytes; }

 private:
  void continueHandshake();

  platform::linux_::UniqueFd fd_;
  bool ready_ = false;
  bool ended_ = false;
  platform::linux_::dbus::HandshakeLine line_;
  std::string output_;
  std::size_t sent_ = 0;
  std::vector<std::byte> input_;
  std::size_t filled_ = 0;
  std::size_t consumed_ = 0;
};

// A connection, its place, and the places that were tried before without finding a service.
struct ConnectedStream {
  ServiceStream stream;
  std::string place;
  std::vector<TriedPlace> passedOver;
};

// Connects to the first of the places at which a service listens. `places` must not be empty. Does
// not wait for the service: the handshake follows. A service that exists but cannot be reached ends
// the search. The failure names the places that were tried.
std::variant<ConnectedStream, Failure> connectToService(const std::vector<std::string>& places);

// The header of an answer.
struct Answer {
  std::uint32_t replySerial = 0;
  bool isError = false;
  std::span<const std::byte> frame;
};

// The first frame of the input.
struct NextFrame {
  enum class State : std::uint8_t {
    kIncomplete,  // wait for more bytes
    kAnswer,      // `answer` names the call
    kOther,       // a frame that answers nothing: ignore it
    kBroken,      // not D-Bus: the connection cannot be used any more
  };
  State state = State::kIncomplete;
  std::size_t bytes = 0;  // bytes to consume
  Answer answer;
};

// Looks at the first frame. The plain answers of the service are recognised by their first bytes;
// any other header is read and checked. Bodies are not read.
NextFrame nextFrame(std::span<const std::byte> input);

}  // namespace halvox::client
