#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include <sys/types.h>

// The authentication before the first message, for both sides. These classes do no input or output:
// the owner of the socket passes in what it has read, and sends the output that it gets back.
namespace halvox::platform::linux_::dbus {

enum class HandshakeState : std::uint8_t {
  kContinue,  // more input is needed
  kDone,      // messages follow, starting after the consumed bytes
  kFailed,    // send the remaining output, then close
};

// The result of one step of a handshake.
struct HandshakeProgress {
  HandshakeState state = HandshakeState::kContinue;
  // How many bytes of the input belonged to the handshake: all of them, unless the handshake is
  // over.
  std::size_t consumedBytes = 0;
  // Why it failed: one line of printable ASCII.
  std::string error;
};

// A handshake fails if a line is longer than kMaxHandshakeLine, or if more than kMaxRefusedLines
// lines were refused. Without these limits, a client that does not know the protocol could keep the
// service busy.
inline constexpr std::size_t kMaxHandshakeLine = std::size_t{16} * 1024;
inline constexpr unsigned kMaxRefusedLines = 16;

// Collects the lines of a handshake from input that arrives in pieces of any size.
class HandshakeLine {
 public:
  // Takes bytes up to the end of the line, and removes them from `input`. Returns true if the line
  // is complete.
  bool take(std::span<const std::byte>& input);
  // The line without its end; valid until the next take().
  [[nodiscard]] std::string_view text() const;
  [[nodiscard]] bool isTooLong() const;

 private:
  std::string line_;
  bool complete_ = false;
};

// The service's side of the handshake. The identity of the peer comes from the credentials of the
// socket (`peerUid`). A client may omit its identity. If it claims one, the identity must be equal
// to `peerUid`.
//
//   NUL ──► auth ──AUTH──► begin ──BEGIN──► done
//            │▲  AUTH without an identity: data ──DATA──► begin
//            └┘  anything that is refused
//
// Offers EXTERNAL and ANONYMOUS. ANONYMOUS is as safe as EXTERNAL, because the peer's identity
// comes from the kernel and not from the handshake. Does not agree to pass file descriptors.
// Belongs to the thread of the connection, which owns it until the handshake is done.
class ServerHandshake {
 public:
  // `guidHex` is the identity of the service, 32 hexadecimal digits.
  ServerHandshake(std::string guidHex, uid_t peerUid);

  // Takes input in pieces of any size, and appends the answers to `output`. Takes no input after
  // the handshake is done or has failed.
  HandshakeProgress feed(std::span<const std::byte> input, std::string& output);

 private:
  enum class Step : std::uint8_t { kNul, kAuth, kData, kBegin, kDone, kFailed };

  void onLine(std::string_view line, std::string& output);
  void onAuth(std::string_view arguments, std::string& output);
  void onIdentity(std::string_view hex, std::string& output);
  void onCancel(std::string_view command, std::string& output);
  void accept(std::string& output);
  void reject(std::string& output);
  void refuse(std::string_view reason, std::string& output);
  void countRefusal();
  void fail(std::string error);
  [[nodiscard]] bool isOver() const;

  std::string guidHex_;
  std::string peerUid_;
  Step step_ = Step::kNul;
  unsigned refusedLines_ = 0;
  HandshakeLine line_;
  std::string error_;
};

// The client's side of the handshake, for a client that connects to a bus as the user `uid`.
// Belongs to one thread. Owned by the BusConnector.
//
//   start() ──► waiting for OK ──► done, or failed at any other line
class ClientHandshake {
 public:
  explicit ClientHandshake(uid_t uid) : uid_(uid) {}

  // Appends the first line of the client. Call it once, before feed().
  void start(std::string& output) const;
  // Takes the server's answers. The handshake is done when the server has agreed. `output` then
  // ends with the line BEGIN, and messages may follow it.
  HandshakeProgress feed(std::span<const std::byte> input, std::string& output);
  // The identity of the server; empty before the handshake is done.
  [[nodiscard]] std::string_view serverGuid() const { return guid_; }

 private:
  void onLine(std::string_view line, std::string& output);

  uid_t uid_;
  HandshakeState state_ = HandshakeState::kContinue;
  HandshakeLine line_;
  std::string guid_;
  std::string error_;
};

}  // namespace halvox::platform::linux_::dbus
