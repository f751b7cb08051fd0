#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/log/LogLineFormatter.h"
#include "platform/linux/log/LogSink.h"

namespace halvox::platform::linux_ {
namespace {

using Clock = std::chrono::steady_clock;

// A pipe that poll(2) reports as writable accepts this many bytes without blocking (PIPE_BUF).
constexpr std::size_t kChunk = 4096;
// How long the end of the service waits for a reader that does not read.
constexpr std::chrono::milliseconds kLastWait{1000};

// Waits for its reader in poll(2) without a time-out. A stuck reader therefore causes no wake-ups.
// finish() wakes it through an event descriptor. The log's descriptor stays blocking, because it is
// shared with other processes. poll() and short writes keep the thread from blocking in write(2).
// Threads: the log's thread calls write(); any thread may call finish().
class TextLogSink final : public LogSink {
 public:
  explicit TextLogSink(int descriptor)
      : descriptor_(descriptor), finish_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

  std::size_t write(std::span<const LogEntry> entries) override;
  void finish() override {
    const std::uint64_t one = 1;
    static_cast<void>(!::write(finish_.get(), &one, sizeof one));
  }

 private:
  bool writeAll(std::string_view text);
  bool waitForReader();

  const int descriptor_;
  const UniqueFd finish_;
  LogLineFormatter formatter_;
  std::optional<Clock::time_point> deadline_;  // set after finish()
};

std::size_t TextLogSink::write(std::span<const LogEntry> entries) {
  std::size_t written = 0;
  for (const LogEntry& entry : entries) {
    if (writeAll(formatter_.format(entry))) ++written;
  }
  return written;
}

bool TextLogSink::writeAll(std::string_view text) {
  while (!text.empty()) {
    if (!waitForReader()) return false;
    const ssize_t count = ::write(descriptor_, text.data(), std::min(text.size(), kChunk));
    if (count < 0 && (errno == EINTR || errno == EAGAIN)) continue;
    if (count < 0) return false;
    text.remove_prefix(static_cast<std::size_t>(count));
  }
  return true;
}

bool TextLogSink::waitForReader() {
  for (;;) {
    std::array<pollfd, 2> polled{{{descriptor_, POLLOUT, 0}, {finish_.get(), POLLIN, 0}}};
    int timeout = -1;
    if (deadline_.has_value()) {
      const auto left =
          std::chrono::duration_cast<std::chrono::milliseconds>(*deadline_ - Clock::now());
      timeout = static_cast<int>(std::max<std::int64_t>(left.count(), 0));
      // Do not poll `finish_` any more, because it stays readable and would end each wait at once.
      polled[1].fd = -1;
    }
    const int ready = ::poll(polled.data(), polled.size(), timeout);
    if (ready < 0 && errno == EINTR) continue;
    if (ready <= 0) return false;
    if (polled[0].revents != 0) return true;  // write(2) reports an error
    deadline_ = Clock::now() + kLastWait;
  }
}

}  // namespace

std::unique_ptr<LogSink> makeTextLogSink(int descriptor) {
  return std::make_unique<TextLogSink>(descriptor);
}

}  // namespace halvox::platform::linux_
