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
  // Where the file is. The directory is made when the file is needed.
  std::filesystem::path directory;
  // MiB of memory that the service keeps for one client. Histories begin to overflow at a quarter
  // of it. The rest is for what cannot leave memory.
  std::uint64_t clientMegabytes = defaults::kClientHistoryMegabytes;
};

// Keeps bytes in one file without a name, which the kernel removes with the process. The file is
// made when it is first needed. Room that is given back is punched out of the file, and the file is
// cut to nothing when all of it has been given back.
//
// Any thread may call; writes and reads of different threads run side by side. An error has the
// directory and the system's text; a later write tries again. Counts what it writes and what fails.
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
