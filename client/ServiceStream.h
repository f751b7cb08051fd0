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
// When the stream is ready, the owner appends frames and calls send(), which writes all of them in
// one system call. The owner must not send frames earlier, because some servers overlook frames
// that arrive in one piece with the end of the handshake. receive() reads the bytes that have
// arrived; the owner then takes frames out of input(). send() and receive() return false if the
// connection has ended. Belongs to one thread at a time.
class ServiceStream {
 public:
  ServiceStream() = default;
  explicit ServiceStream(platform::linux_::UniqueFd connected);

  [[nodiscard]] bool isOpen() const { return static_cast<bool>(fd_) && !ended_; }
  // Returns true if the service has agreed to the handshake.
  [[nodiscard]] bool isReady() const { return ready_; }
  // Returns the argument for poll(2): waits for `events`, and for POLLOUT while output is unsent.
  [[nodiscard]] pollfd polled(short events) const {
    return {fd_.get(), static_cast<short>(hasOutput() ? events | POLLOUT : events), 0};
  }
  // Returns true while appended bytes wait for send() or for the socket to become writable.
  [[nodiscard]] bool hasOutput() const { return sent_ < output_.size(); }
  [[nodiscard]] std::size_t outputBytes() const { return output_.size() - sent_; }

  // Appends `size` bytes to the output, and returns their address. The caller writes the frame
  // there.
  char* append(std::size_t size);
  void append(std::string_view frame) { frame.copy(append(frame.size()), frame.size()); }
  bool send();
  bool receive();
  // Reads bytes that the service sent before the connection ended. Returns false if there are none.
  bool receiveRest();
  // Ends the connection from this side, without closing the socket yet.
  void end() { ended_ = true; }

  // Returns the bytes that were received and not yet consumed. After the handshake they begin with
  // a frame.
  [[nodiscard]] std::span<const std::byte> input() const;
  void consume(std::size_t bytes) { consumed_ += bytes; }

 private:
  bool readInput();
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

// A connection, its place, and the places that were tried before it and had no service.
struct ConnectedStream {
  ServiceStream stream;
  std::string place;
  std::vector<TriedPlace> passedOver;
};

// Connects to the first of the places at which a service listens. `places` must not be empty. Does
// not wait for the service, and returns before the handshake. If a service exists but cannot be
// reached, the search ends. The failure names the places that were tried.
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
    kEnded,       // the service ends; `lastRequest` is the last one that it has taken
    kOther,       // a frame that answers nothing: ignore it
    kBroken,      // not D-Bus: the connection cannot be used any more
  };
  State state = State::kIncomplete;
  std::size_t bytes = 0;  // bytes to consume
  Answer answer;
  std::uint32_t lastRequest = 0;
};

// Looks at the first frame of `input`. Recognises the usual answers of the service by their first
// bytes. Reads and checks the header of any other frame. Does not read bodies.
NextFrame nextFrame(std::span<const std::byte> input);

}  // namespace halvox::client
