#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include <sys/types.h>

// The authentication that comes before the first message, for either side, without input or output
// of its own: the owner of the socket hands in what it read and sends what it is given.
namespace halvox::platform::linux_::dbus {

enum class HandshakeState : std::uint8_t {
  kContinue,  // more input is needed
  kDone,      // messages follow; input behind the consumed bytes is already part of them
  kFailed,    // send the output that there is, then close
};

// What one step of a handshake came to.
struct HandshakeProgress {
  HandshakeState state = HandshakeState::kContinue;
  // How much of the input belonged to the handshake. All of it, unless the handshake is done.
  std::size_t consumedBytes = 0;
  // Why it failed: one line of printable ASCII.
  std::string error;
};

// A line longer than this, and more refused lines than that, end a handshake.
inline constexpr std::size_t kMaxHandshakeLine = std::size_t{16} * 1024;
inline constexpr unsigned kMaxRefusedLines = 16;

// Collects the lines of a handshake from input that comes in pieces of any size.
class HandshakeLine {
 public:
  // Takes input up to the end of the line and drops it from `input`. True when the line is
  // complete.
  bool take(std::span<const std::byte>& input);
  // The line without its end; valid until the next take().
  [[nodiscard]] std::string_view text() const;
  [[nodiscard]] bool isTooLong() const;

 private:
  std::string line_;
  bool complete_ = false;
};

// The service's side. Who the peer is comes from the credentials of the socket (`peerUid`); an
// identity that the client claims must be that one or be left out.
//
//   NUL ──► auth ──AUTH──► begin ──BEGIN──► done
//            │▲  AUTH without an identity: data ──DATA──► begin
//            └┘  whatever is refused
//
// Offers EXTERNAL and ANONYMOUS; takes no file descriptors. Belongs to one thread.
class ServerHandshake {
 public:
  // `guidHex` is the address's 32 hexadecimal digits.
  ServerHandshake(std::string guidHex, uid_t peerUid);

  // Takes input in pieces as they come and appends the answers to `output`. Once done or failed it
  // takes nothing more.
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

// The side of a client that connects to a bus as this user. Belongs to one thread.
class ClientHandshake {
 public:
  explicit ClientHandshake(uid_t uid) : uid_(uid) {}

  // Appends what the client says first. Call it once, before feed().
  void start(std::string& output) const;
  // Takes the server's answers. Done as soon as the server agreed; `output` then has the line after
  // which messages may follow.
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
