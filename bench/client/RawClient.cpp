#include "bench/client/RawClient.h"

#include <cerrno>
#include <chrono>
#include <cstring>
#include <stdexcept>
#include <string_view>
#include <thread>

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"

namespace halvox::bench {
namespace {

[[noreturn]] void fail(const std::string& what) {
  throw std::runtime_error(what + ": " + platform::linux_::errnoText(errno));
}

class Encoder {
 public:
  Encoder(std::string& out, std::size_t start) : out_(out), start_(start) {}

  void align(std::size_t to) {
    while ((out_.size() - start_) % to != 0) out_ += '\0';
  }
  template <typename Number>
  void number(Number value) {
    align(sizeof value);
    char bytes[sizeof value];
    std::memcpy(bytes, &value, sizeof value);
    out_.append(bytes, sizeof bytes);
  }
  void text(std::string_view value) {
    number(static_cast<std::uint32_t>(value.size()));
    out_ += value;
    out_ += '\0';
  }
  void key(std::string_view name, char type) {
    align(8);
    text(name);
    const char signature[3] = {1, type, 0};
    out_.append(signature, sizeof signature);
  }
  void patch(std::size_t position, std::size_t value) {
    const auto number = static_cast<std::uint32_t>(value);
    std::memcpy(&out_[position], &number, sizeof number);
  }

 private:
  std::string& out_;
  std::size_t start_;
};

std::string makeHeader(std::string_view member, std::string_view signature) {
  std::string header{'l', 1, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0};
  Encoder encoder(header, 0);
  const auto field = [&](char code, char type, std::string_view value) {
    encoder.align(8);
    const char start[4] = {code, 1, type, 0};
    header.append(start, sizeof start);
    if (type == 'g') {
      header += static_cast<char>(value.size());
      header += value;
      header += '\0';
    } else {
      encoder.text(value);
    }
  };
  field(1, 'o', "/com/tarno/halvox/reporting");
  field(2, 's', "com.tarno.halvox.HVReportingServiceProtocol");
  field(3, 's', member);
  field(8, 'g', signature);
  encoder.patch(12, header.size() - 16);
  encoder.align(8);
  return header;
}

}  // namespace

RawClient::RawClient(const std::string& socketPath, std::int64_t reporter)
    : reporter_(reporter), input_(std::size_t{64} * 1024) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  socketPath.copy(address.sun_path, sizeof address.sun_path - 1);
  fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (connect(fd_, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) fail("connect");
  constexpr std::string_view kDigits = "0123456789";
  std::string identity;
  for (const char digit : std::to_string(getuid())) {
    identity += '3';
    identity += kDigits[static_cast<std::size_t>(digit - '0')];
  }
  output_ = std::string(1, '\0') + "AUTH EXTERNAL " + identity + "\r\nBEGIN\r\n";
  sendAll();
  std::string line;
  while (!line.ends_with("\r\n")) {
    char byte = 0;
    if (read(fd_, &byte, 1) != 1) fail("handshake");
    line += byte;
  }
}

RawClient::~RawClient() { close(fd_); }

void RawClient::encode(std::int64_t value) {
  static const std::string header = makeHeader("sendMessage", "a{sv}uqaax");
  const std::size_t start = output_.size();
  output_ += header;
  Encoder encoder(output_, start);
  const std::size_t body = output_.size();
  encoder.number(std::uint32_t{0});
  encoder.align(8);
  const std::size_t entries = output_.size();
  encoder.key("frame_counter", 'x');
  encoder.number(value);
  encoder.key("sample_rate", 'd');
  encoder.number(48000.0);
  encoder.key("channels", 'x');
  encoder.number(std::int64_t{2});
  encoder.key("io_buffer_frames", 'x');
  encoder.number(std::int64_t{512});
  encoder.key("is_running", 'b');
  encoder.number(std::uint32_t{1});
  encoder.key("volume", 'd');
  encoder.number(0.75);
  encoder.key("route", 's');
  encoder.text(variesTexts_ ? mixedText(value, 12) : "Speaker");
  encoder.key("format", 's');
  encoder.text("lpcm/float32");
  encoder.key("device_uid", 's');
  encoder.text(variesTexts_ ? mixedText(value + 1, 42)
                            : "alsa_output.pci-0000_00_1f.3.analog-stereo");
  encoder.key("latency_ms", 'd');
  encoder.number(10.67);
  encoder.patch(body, output_.size() - entries);
  encoder.number(std::uint32_t{4});
  encoder.number(std::uint16_t{18});
  encoder.align(sizeof(std::uint32_t));
  const std::size_t outer = output_.size();
  encoder.number(std::uint32_t{0});
  encoder.number(static_cast<std::uint32_t>(sizeof reporter_));
  encoder.number(reporter_);
  encoder.patch(outer, output_.size() - outer - sizeof(std::uint32_t));
  encoder.patch(start + 4, output_.size() - body);
  encoder.patch(start + 8, ++serial_);
}

std::string RawClient::mixedText(std::int64_t number, std::size_t length) {
  std::string text;
  auto state = static_cast<std::uint64_t>(number) * 0x9E3779B97F4A7C15U + 1;
  while (text.size() < length) {
    state ^= state << 13U;
    state ^= state >> 7U;
    state ^= state << 17U;
    text += static_cast<char>('a' + static_cast<int>(state % 26));
  }
  return text;
}

void RawClient::sendAll() {
  std::size_t sent = 0;
  while (sent < output_.size()) {
    const ssize_t size = send(fd_, output_.data() + sent, output_.size() - sent, MSG_NOSIGNAL);
    if (size <= 0) fail("send");
    sent += static_cast<std::size_t>(size);
  }
  output_.clear();
}

std::int64_t RawClient::receive() {
  const ssize_t size = recv(fd_, input_.data() + filled_, input_.size() - filled_, 0);
  if (size <= 0) fail("receive");
  filled_ += static_cast<std::size_t>(size);
  std::int64_t answers = 0;
  std::size_t used = 0;
  while (filled_ - used >= 16) {
    std::uint32_t body = 0;
    std::uint32_t fields = 0;
    std::memcpy(&body, &input_[used + 4], sizeof body);
    std::memcpy(&fields, &input_[used + 12], sizeof fields);
    const std::size_t total = ((16 + std::size_t{fields} + 7) & ~std::size_t{7}) + body;
    if (filled_ - used < total) break;
    if (input_[used + 1] == 2) ++answers;
    if (input_[used + 1] == 3) throw std::runtime_error("the server refused a request");
    used += total;
  }
  std::memmove(input_.data(), input_.data() + used, filled_ - used);
  filled_ -= used;
  return answers;
}

void RawClient::pipeline(std::int64_t count, std::int64_t window) {
  std::int64_t sent = 0;
  std::int64_t answered = 0;
  while (answered < count) {
    while (sent < count && sent - answered < window) encode(sent++);
    sendAll();
    while (answered < count && (sent - answered > window / 2 || sent == count)) {
      answered += receive();
    }
  }
}

std::vector<double> RawClient::ping(int count) {
  using Clock = std::chrono::steady_clock;
  std::vector<double> times;
  times.reserve(static_cast<std::size_t>(count));
  auto next = Clock::now();
  for (int number = 0; number < count; ++number) {
    next += std::chrono::milliseconds(1);
    std::this_thread::sleep_until(next);
    const auto begin = Clock::now();
    encode(number);
    sendAll();
    waitForAnswer();
    times.push_back(std::chrono::duration<double>(Clock::now() - begin).count());
  }
  return times;
}

void RawClient::request(std::string_view member) {
  const std::size_t start = output_.size();
  output_ += makeHeader(member, "x");
  Encoder encoder(output_, start);
  encoder.number(reporter_);
  encoder.patch(start + 4, sizeof reporter_);
  encoder.patch(start + 8, ++serial_);
  sendAll();
}

void RawClient::waitForAnswer() {
  while (receive() == 0) {
  }
}

std::size_t RawClient::frameBytes() {
  encode(0);
  const std::size_t bytes = output_.size();
  output_.clear();
  --serial_;
  return bytes;
}

}  // namespace halvox::bench
