#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <span>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/configuration/Defaults.h"
#include "platform/overflow.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

struct OverflowOptions {
  // The directory of the file. It is made when the file is first needed.
  std::filesystem::path directory;
  // The memory, in MiB, that the service holds for one client at most. Histories begin to overflow
  // into the file at a quarter of this memory. The rest is for data that cannot leave memory.
  std::uint64_t clientMegabytes = defaults::kClientHistoryMegabytes;
};

// Stores bytes in one file without a name, which the kernel removes when the process ends. The file
// is made when it is first needed. release() punches the released bytes out of the file. When all
// bytes have been released, the file is truncated.
//
// Any thread may call. Different threads may write and read at the same time. An error names the
// directory and has the system's text. A later write tries again. Counts the written and released
// bytes, and the failures.
class FileOverflowService final : public OverflowService {
 public:
  // Does not own `statistics`, which must outlive this.
  FileOverflowService(OverflowOptions options, StatisticsService& statistics);

  [[nodiscard]] std::size_t memoryPerClient() const override;
  std::optional<Error> write(std::span<const std::byte> bytes, OverflowPlace& place) override;
  std::optional<Error> read(OverflowPlace place, std::span<std::byte> bytes) override;
  void release(OverflowPlace place) override;

 private:
  struct Counters {
    Counter& written;
    Counter& released;
    Counter& failed;
  };

  [[nodiscard]] int createFile() HALVOX_REQUIRES(mutex_);
  void giveBack(OverflowPlace place) HALVOX_REQUIRES(mutex_);
  [[nodiscard]] std::optional<Error> fail(const char* what, int systemError);

  const OverflowOptions options_;
  const Counters counters_;
  Mutex mutex_;
  UniqueFd file_ HALVOX_GUARDED_BY(mutex_);           // stays open once it is made
  std::uint64_t end_ HALVOX_GUARDED_BY(mutex_) = 0;   // where the next bytes go
  std::uint64_t used_ HALVOX_GUARDED_BY(mutex_) = 0;  // bytes that are not released
};

}  // namespace halvox::platform::linux_
