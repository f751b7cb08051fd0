#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace halvox::bench {

// The reference for the client library: a hand-written encoder of one fixed message of ten fields,
// which gathers frames and sends them in one write. Blocking, on one thread; shares no code with
// the library. Throws std::runtime_error on any failure.
class RawClient {
 public:
  explicit RawClient(const std::string& socketPath);
  ~RawClient();
  RawClient(const RawClient&) = delete;
  RawClient& operator=(const RawClient&) = delete;

  // Sends `count` messages with at most `window` unanswered, half a window in each write, and waits
  // for all answers.
  void pipeline(std::int64_t count, std::int64_t window);
  // The size of one frame in bytes.
  [[nodiscard]] std::size_t frameBytes();

 private:
  void encode(std::int64_t value);
  void sendAll();
  std::int64_t receive();

  int fd_ = -1;
  std::uint32_t serial_ = 0;
  std::string output_;
  std::vector<char> input_;
  std::size_t filled_ = 0;
};

}  // namespace halvox::bench
