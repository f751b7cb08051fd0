#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <vector>

#include "platform/overflow.h"

namespace halvox::platform {

// Keeps bytes in memory. Any thread may call the service; only the test's thread calls the other
// functions. FakePlatform owns it.
class FakeOverflowService final : public OverflowService {
 public:
  // 64 MiB at first.
  void setMemoryPerClient(std::size_t bytes);
  // From now on writing, or reading, fails with that error; std::nullopt ends the failures. The
  // first `writes` writes still succeed.
  void setWriteError(std::optional<Error> error, std::size_t writes = 0);
  void setReadError(std::optional<Error> error);

  // Changes the byte at `position` in each stored piece that is long enough, like a damaged disk.
  void damage(std::size_t position, std::byte value);

  // The bytes that were written and not released.
  [[nodiscard]] std::size_t keptBytes() const;
  // The number of pieces that they were written in.
  [[nodiscard]] std::size_t keptPieces() const;
  [[nodiscard]] std::size_t failedWrites() const;

  [[nodiscard]] std::size_t memoryPerClient() const override;
  std::optional<Error> write(std::span<const std::byte> bytes, OverflowPlace& place) override;
  std::optional<Error> read(OverflowPlace place, std::span<std::byte> bytes) override;
  // Throws std::logic_error for a place that is not valid.
  void release(OverflowPlace place) override;

 private:
  mutable std::mutex mutex_;
  std::size_t memoryPerClient_ = std::size_t{64} * 1024 * 1024;
  std::optional<Error> writeError_;
  std::size_t writesBeforeError_ = 0;
  std::optional<Error> readError_;
  std::size_t failedWrites_ = 0;
  std::uint64_t next_ = 0;
  std::map<std::uint64_t, std::vector<std::byte>> pieces_;  // by offset
};

}  // namespace halvox::platform
