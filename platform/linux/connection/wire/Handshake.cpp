#include "platform/linux/connection/wire/Handshake.h"

#include <algorithm>

#include "platform/linux/base/Hexadecimal.h"

namespace halvox::platform::linux_::dbus {
namespace {

constexpr std::string_view kLineEnd = "\r\n";

struct Command {
  std::string_view name;
  std::string_view arguments;
};

// Returns the first word of a line, and what follows the first blank.
Command split(std::string_view line) {
  const std::size_t blank = line.find(' ');
  if (blank == std::string_view::npos) return {line, {}};
  return {line.substr(0, blank), line.substr(blank + 1)};
}

bool isPrintableAscii(std::string_view line) {
  return std::ranges::all_of(line, [](char c) { return c >= ' ' && c <= '~'; });
}

int digitOf(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

bool isHex(std::string_view text) {
  return text.size() % 2 == 0 && std::ranges::all_of(text, [](char c) { return digitOf(c) >= 0; });
}

std::string fromHex(std::string_view hex) {
  std::string bytes;
  for (std::size_t index = 0; index < hex.size(); index += 2) {
    bytes += static_cast<char>(16 * digitOf(hex[index]) + digitOf(hex[index + 1]));
  }
  return bytes;
}

std::string quoted(std::string_view line) {
  constexpr std::size_t kShown = 64;
  if (!isPrintableAscii(line)) return "a line that is not printable ASCII";
  std::string text = "\"" + std::string(line.substr(0, kShown)) + "\"";
  return line.size() > kShown ? text + "..." : text;
}

}  // namespace

// --- HandshakeLine ------------------------------------------------------------------------------

bool HandshakeLine::take(std::span<const std::byte>& input) {
  if (complete_) line_.clear();
  complete_ = false;
  std::size_t taken = 0;
  // Take nothing after the end of the line. After the line BEGIN comes the first message, often in
  // the same read.
  while (!complete_ && taken < input.size() && !isTooLong()) {
    line_ += std::to_integer<char>(input[taken++]);
    complete_ = !isTooLong() && line_.ends_with(kLineEnd);
  }
  input = input.subspan(taken);
  return complete_;
}

std::string_view HandshakeLine::text() const {
  return std::string_view(line_).substr(0, line_.size() - kLineEnd.size());
}

bool HandshakeLine::isTooLong() const { return line_.size() > kMaxHandshakeLine; }

// --- ServerHandshake ----------------------------------------------------------------------------

ServerHandshake::ServerHandshake(std::string guidHex, uid_t peerUid)
    : guidHex_(std::move(guidHex)), peerUid_(std::to_string(peerUid)) {}

HandshakeProgress ServerHandshake::feed(std::span<const std::byte> input, std::string& output) {
  std::span<const std::byte> rest = input;
  if (step_ == Step::kNul && !rest.empty()) {
    // D-Bus requires this byte. Some systems send the credentials with it; on Linux the kernel
    // provides them without it.
    if (rest.front() != std::byte{0}) fail("the first byte is not NUL");
    if (step_ == Step::kNul) step_ = Step::kAuth;
    rest = rest.subspan(1);
  }
  while (!isOver() && line_.take(rest)) onLine(line_.text(), output);
  if (!isOver() && line_.isTooLong()) fail("a line has more than 16 KiB");

  HandshakeProgress progress;
  progress.consumedBytes = input.size() - rest.size();
  progress.error = error_;
  if (step_ == Step::kDone) progress.state = HandshakeState::kDone;
  if (step_ == Step::kFailed) progress.state = HandshakeState::kFailed;
  return progress;
}

bool ServerHandshake::isOver() const { return step_ == Step::kDone || step_ == Step::kFailed; }

void ServerHandshake::onLine(std::string_view line, std::string& output) {
  const auto [command, arguments] = split(line);
  if (!isPrintableAscii(line)) {
    // Do not quote the line in the answer, because it may contain anything.
    refuse("not printable ASCII", output);
  } else if (command == "BEGIN") {
    if (step_ == Step::kBegin) {
      step_ = Step::kDone;
    } else {
      // Do not answer with ERROR. The client may already be sending messages, and D-Bus requires
      // that the server disconnects.
      fail("BEGIN before the authentication");
    }
  } else if (command == "AUTH" && step_ == Step::kAuth) {
    onAuth(arguments, output);
  } else if (command == "DATA" && step_ == Step::kData) {
    onIdentity(arguments, output);
  } else if (command == "CANCEL" || command == "ERROR") {
    onCancel(command, output);
  } else if (command == "NEGOTIATE_UNIX_FD" && step_ == Step::kBegin) {
    // After this answer, clients continue without passing descriptors. A service that accepts no
    // descriptors cannot leak any.
    output += "ERROR file descriptors are not taken\r\n";
    countRefusal();
  } else {
    refuse("unknown command, or one that is not expected now", output);
  }
}

void ServerHandshake::onAuth(std::string_view arguments, std::string& output) {
  const auto [mechanism, response] = split(arguments);
  if (mechanism == "ANONYMOUS") {
    if (isHex(response)) {
      // Accept anonymous clients. The kernel provides the client's identity in any case, and the
      // handshake cannot change it.
      accept(output);  // ignores the trace that the client sends
    } else {
      reject(output);
    }
  } else if (mechanism != "EXTERNAL") {
    reject(output);
  } else if (response.empty()) {
    // The identity may follow in a separate line, as sd-bus sends it.
    step_ = Step::kData;
    output += "DATA\r\n";
  } else {
    onIdentity(response, output);
  }
}

void ServerHandshake::onIdentity(std::string_view hex, std::string& output) {
  // An empty identity stands for the identity that the kernel provides. Any other must be equal to
  // the kernel's.
  if (hex.empty() || (isHex(hex) && fromHex(hex) == peerUid_)) {
    accept(output);
  } else {
    reject(output);
  }
}

// Only an attempt that has begun can be cancelled.
void ServerHandshake::onCancel(std::string_view command, std::string& output) {
  if (command == "CANCEL" && step_ == Step::kAuth) {
    refuse("there is nothing to cancel", output);
  } else {
    reject(output);
  }
}

void ServerHandshake::accept(std::string& output) {
  step_ = Step::kBegin;
  output += "OK " + guidHex_ + "\r\n";
}

void ServerHandshake::reject(std::string& output) {
  step_ = Step::kAuth;
  output += "REJECTED EXTERNAL ANONYMOUS\r\n";
  countRefusal();
}

void ServerHandshake::refuse(std::string_view reason, std::string& output) {
  output.append("ERROR ").append(reason).append(kLineEnd);
  countRefusal();
}

void ServerHandshake::countRefusal() {
  if (++refusedLines_ > kMaxRefusedLines) fail("more than 16 lines were refused");
}

void ServerHandshake::fail(std::string error) {
  step_ = Step::kFailed;
  error_ = std::move(error);
}

// --- ClientHandshake ----------------------------------------------------------------------------

void ClientHandshake::start(std::string& output) const {
  output += '\0';
  output += "AUTH EXTERNAL " + hexadecimal(std::to_string(uid_)) + "\r\n";
}

HandshakeProgress ClientHandshake::feed(std::span<const std::byte> input, std::string& output) {
  std::span<const std::byte> rest = input;
  if (state_ == HandshakeState::kContinue) {
    // Take only one line. A server answers with one line, and the bytes after it belong to the
    // messages.
    if (line_.take(rest)) {
      onLine(line_.text(), output);
    } else if (line_.isTooLong()) {
      state_ = HandshakeState::kFailed;
      error_ = "the server sent a line of more than 16 KiB";
    }
  }
  return {state_, input.size() - rest.size(), error_};
}

void ClientHandshake::onLine(std::string_view line, std::string& output) {
  constexpr std::size_t kGuidLength = 32;
  const auto [command, arguments] = split(line);
  if (command == "OK" && arguments.size() == kGuidLength && isHex(arguments)) {
    state_ = HandshakeState::kDone;
    guid_ = arguments;
    output += "BEGIN\r\n";
    return;
  }
  state_ = HandshakeState::kFailed;
  error_ = "the server answered the authentication with " + quoted(line);
}

}  // namespace halvox::platform::linux_::dbus
