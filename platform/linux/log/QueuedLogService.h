#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/log/LogMemory.h"
#include "platform/linux/log/LogQueue.h"
#include "platform/linux/log/LogSink.h"
#include "platform/log.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The log of the service. Lines go through a bounded queue to a thread that formats and writes
// them, so a slow reader of the log never holds up those who log: lines that find no room are
// dropped and counted, errors last, and the loss is told in the log as soon as there is room.
// Control characters in a line are escaped and very long lines are cut, since clients' texts are
// logged. Nothing runs while nothing is logged.
//
// Beside that the newest lines stay in memory at a level of their own, for captures of diagnostics.
//
// Any thread may log. The categories live as long as the service, which main keeps to the end.
class QueuedLogService final : public LogService {
 public:
  // The least level that is written, and the least that is kept in memory; none: nothing is kept.
  struct Levels {
    Levels(LogLevel toWrite) : written(toWrite) {}  // implicit: most name one
    Levels(LogLevel toWrite, LogLevel toKeep) : written(toWrite), kept(toKeep) {}
    LogLevel written;
    std::optional<LogLevel> kept;
  };

  // Lines below both levels are not wanted. `statistics` must outlive the service.
  QueuedLogService(Levels levels, std::unique_ptr<LogSink> sink, StatisticsService& statistics);
  // To standard error, or to the journal when that is where standard error goes.
  static std::unique_ptr<QueuedLogService> onStandardError(Levels levels,
                                                           StatisticsService& statistics);
  ~QueuedLogService() override;

  LogCategory& createCategory(std::string_view subsystem, std::string_view category) override;

  // Writes what is waiting, for about a second at most when the reader is stuck, and ends the
  // thread. Lines logged later are dropped and counted. May be called again.
  void stop();

  // The newest lines that were kept in memory.
  [[nodiscard]] LogMemory::Contents keptLines() const;

 private:
  class Category;

  void add(LogEntry entry);
  void run();
  void reportLosses();

  const Levels levels_;
  const std::unique_ptr<LogMemory> memory_;  // null: nothing is kept
  const std::unique_ptr<LogSink> sink_;
  Counter& received_;
  Counter& written_;
  Counter& dropped_;
  Counter& failed_;
  LogQueue queue_;
  // Orders with nothing: it is only told.
  std::atomic<std::uint64_t> unreported_{0};
  Mutex mutex_;
  std::map<std::pair<std::string, std::string>, std::unique_ptr<Category>> categories_
      HALVOX_GUARDED_BY(mutex_);
  std::thread thread_;  // last: it uses all of the above
};

}  // namespace halvox::platform::linux_
