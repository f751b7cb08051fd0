#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::bench {

// The reference for the client library: a hand-written encoder of one fixed message of ten fields,
// which gathers frames and sends them in one write. Blocking, on one thread; shares no code with
// the library. Throws std::runtime_error on any failure.
class RawClient {
 public:
  // The messages are for the session with that identifier.
  explicit RawClient(const std::string& socketPath, std::int64_t reporter = 1);
  ~RawClient();
  RawClient(const RawClient&) = delete;
  RawClient& operator=(const RawClient&) = delete;

  // Sends `count` messages with at most `window` unanswered, half a window in each write, and waits
  // for all answers.
  void pipeline(std::int64_t count, std::int64_t window);
  // Sends one message a millisecond, each after the answer to the one before. Returns the time to
  // each answer in seconds.
  std::vector<double> ping(int count);
  // Sends a request that has the session's identifier as its one argument. It is not encoded
  // together with other frames.
  void request(std::string_view member);
  // Waits for the answer to the oldest request without one.
  void waitForAnswer();
  // From now on, each message has a device and a route of its own instead of the same two texts.
  void varyTexts() { variesTexts_ = true; }
  // A text of letters that hardly compresses. Each number gives another text.
  static std::string mixedText(std::int64_t number, std::size_t length);
  // The size of one frame in bytes.
  [[nodiscard]] std::size_t frameBytes();

 private:
  void encode(std::int64_t value);
  void sendAll();
  std::int64_t receive();

  std::int64_t reporter_;
  bool variesTexts_ = false;
  int fd_ = -1;
  std::uint32_t serial_ = 0;
  std::string output_;
  std::vector<char> input_;
  std::size_t filled_ = 0;
};

}  // namespace halvox::bench
