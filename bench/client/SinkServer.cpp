#include "bench/client/SinkServer.h"

#include <chrono>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <thread>
#include <vector>

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace halvox::bench {
namespace {

constexpr std::size_t kReadBytes = std::size_t{256} * 1024;
constexpr std::size_t kFrameStart = 16;
constexpr char kNoReplyExpected = 1;

class Connection {
 public:
  explicit Connection(int fd) : fd_(fd), input_(kReadBytes) {}

  [[nodiscard]] int fd() const { return fd_; }

  // Handles what has arrived. False when the connection has ended.
  bool serve() {
    if (filled_ == input_.size()) input_.resize(2 * input_.size());
    const ssize_t size = recv(fd_, input_.data() + filled_, input_.size() - filled_, MSG_DONTWAIT);
    if (size <= 0) return false;
    filled_ += static_cast<std::size_t>(size);
    std::size_t used = 0;
    if (!authenticated_) used = authenticate();
    if (authenticated_) used += answerFrames(used);
    std::memmove(input_.data(), input_.data() + used, filled_ - used);
    filled_ -= used;
    return sendAll();
  }

 private:
  // Agrees to everything but file descriptors. Returns how much of the input belonged to the
  // handshake.
  std::size_t authenticate() {
    std::size_t used = 0;
    while (!authenticated_) {
      const std::string_view rest(input_.data() + used, filled_ - used);
      const std::size_t end = rest.find("\r\n");
      if (end == std::string_view::npos) break;
      std::string_view line = rest.substr(0, end);
      if (line.starts_with('\0')) line.remove_prefix(1);
      onLine(line);
      used += end + 2;
    }
    return used;
  }

  void onLine(std::string_view line) {
    if (line == "BEGIN") {
      authenticated_ = true;
    } else if (line == "AUTH EXTERNAL") {
      output_ += "DATA\r\n";
    } else if (line.starts_with("NEGOTIATE")) {
      output_ += "ERROR\r\n";
    } else {
      output_ += "OK 00000000000000000000000000000001\r\n";
    }
  }

  std::size_t answerFrames(std::size_t from) {
    std::size_t used = from;
    while (filled_ - used >= kFrameStart) {
      const char* frame = input_.data() + used;
      std::uint32_t body = 0;
      std::uint32_t serial = 0;
      std::uint32_t fields = 0;
      std::memcpy(&body, frame + 4, sizeof body);
      std::memcpy(&serial, frame + 8, sizeof serial);
      std::memcpy(&fields, frame + 12, sizeof fields);
      const std::size_t total = ((kFrameStart + fields + 7) & ~std::size_t{7}) + body;
      if (filled_ - used < total) break;
      if ((frame[2] & kNoReplyExpected) == 0) answer(serial);
      used += total;
    }
    return used - from;
  }

  void answer(std::uint32_t serial) {
    char reply[24] = {'l', 2, 1, 1, 0, 0, 0, 0, 0, 0, 0, 0, 8, 0, 0, 0, 5, 1, 'u', 0, 0, 0, 0, 0};
    ++serial_;
    std::memcpy(reply + 8, &serial_, sizeof serial_);
    std::memcpy(reply + 20, &serial, sizeof serial);
    output_.append(reply, sizeof reply);
  }

  bool sendAll() {
    std::size_t sent = 0;
    while (sent < output_.size()) {
      const ssize_t size = send(fd_, output_.data() + sent, output_.size() - sent, MSG_NOSIGNAL);
      if (size <= 0) return false;
      sent += static_cast<std::size_t>(size);
    }
    output_.clear();
    return true;
  }

  int fd_;
  bool authenticated_ = false;
  std::uint32_t serial_ = 0;
  std::vector<char> input_;
  std::size_t filled_ = 0;
  std::string output_;
};

}  // namespace

int serveSink(const std::string& socketPath) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  socketPath.copy(address.sun_path, sizeof address.sun_path - 1);
  const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (::bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(listener, SOMAXCONN) != 0) {
    return 1;
  }
  for (;;) {
    const int fd = ::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
    if (fd < 0) continue;
    Connection connection(fd);
    pollfd readable{fd, POLLIN, 0};
    while (poll(&readable, 1, -1) >= 0 && connection.serve()) {
    }
    close(fd);
  }
}

SinkProcess::SinkProcess(const std::string& socketPath) : child_(fork()) {
  if (child_ == 0) _exit(serveSink(socketPath));
  while (access(socketPath.c_str(), F_OK) != 0) {
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
}

SinkProcess::~SinkProcess() {
  kill(child_, SIGKILL);
  waitpid(child_, nullptr, 0);
}

}  // namespace halvox::bench
