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

// The log of the service. A bounded queue leads to one thread that formats and writes lines. A slow
// reader of the log therefore never delays the threads that log. When the queue is full, lines are
// dropped and counted; the last part of the queue is kept for errors. The log reports the loss when
// the queue has space again. Lines can contain texts of clients. Control characters are therefore
// escaped, and long lines are cut. The thread sleeps while nothing is logged.
//
// The newest lines also stay in memory, at a level of their own, for captures of diagnostics.
//
// Threads: any may log. Owner: the platform, until the process ends. Categories live as long as the
// service.
class QueuedLogService final : public LogService {
 public:
  // The lowest level of the lines that are written, and of those that are kept in memory. Without
  // `kept`, no line is kept.
  struct Levels {
    Levels(LogLevel toWrite) : written(toWrite) {}  // implicit: most callers name one level
    Levels(LogLevel toWrite, LogLevel toKeep) : written(toWrite), kept(toKeep) {}
    LogLevel written;
    std::optional<LogLevel> kept;
  };

  // Categories report lines below both levels as unwanted, so that callers do not format them.
  // `statistics` must outlive the service.
  QueuedLogService(Levels levels, std::unique_ptr<LogSink> sink, StatisticsService& statistics);
  // Writes to the journal if standard error is connected to it, otherwise to standard error.
  static std::unique_ptr<QueuedLogService> onStandardError(Levels levels,
                                                           StatisticsService& statistics);
  ~QueuedLogService() override;

  LogCategory& createCategory(std::string_view subsystem, std::string_view category) override;

  // Writes the queued lines, waits about a second for a reader that does not read, and ends the
  // thread. Later lines are dropped and counted. May be called again.
  void stop();

  // The lines kept in memory; empty without `Levels::kept`.
  [[nodiscard]] LogMemory::Contents keptLines() const;

 private:
  class Category;

  void add(LogEntry entry);
  void run();
  void reportLosses();

  const Levels levels_;
  const std::unique_ptr<LogMemory> memory_;  // null if no lines are kept
  const std::unique_ptr<LogSink> sink_;
  Counter& received_;
  Counter& written_;
  Counter& dropped_;
  Counter& failed_;
  LogQueue queue_;
  // Lost lines that no log line has reported yet. Orders no other memory.
  std::atomic<std::uint64_t> unreported_{0};
  Mutex mutex_;
  std::map<std::pair<std::string, std::string>, std::unique_ptr<Category>> categories_
      HALVOX_GUARDED_BY(mutex_);
  std::thread thread_;  // last, because it uses all members above
};

}  // namespace halvox::platform::linux_
