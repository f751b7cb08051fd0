#include "platform/linux/log/QueuedLogService.h"

#include <algorithm>
#include <vector>

#include <systemd/sd-journal.h>
#include <unistd.h>

#include "platform/linux/base/ThreadSetup.h"
#include "platform/linux/log/LogLineFormatter.h"

namespace halvox::platform::linux_ {

// A category: adds its names to lines and passes them to the service.
class QueuedLogService::Category final : public LogCategory {
 public:
  Category(QueuedLogService& service, std::string subsystem, std::string category)
      // A line is wanted if it will be written or kept.
      : LogCategory(std::min(service.levels_.written,
                             service.levels_.kept.value_or(service.levels_.written))),
        service_(service),
        subsystem_(std::move(subsystem)),
        category_(std::move(category)) {}

  void write(LogLevel level, std::string_view line) override {
    LogEntry entry{.time = std::chrono::system_clock::now(),
                   .level = level,
                   .subsystem = subsystem_,
                   .category = category_,
                   .text = {},
                   .wholeLength = line.size()};
    const std::string_view start = line.substr(0, kLongestLogLine);
    if (service_.levels_.kept.has_value() && level >= *service_.levels_.kept) {
      service_.memory_->add(entry, start);
    }
    if (level < service_.levels_.written) return;
    // Copy the text only now, because a line that is not written needs no copy.
    entry.text = start;
    service_.add(std::move(entry));
  }

 private:
  QueuedLogService& service_;
  const std::string subsystem_;
  const std::string category_;
};

QueuedLogService::QueuedLogService(Levels levels, std::unique_ptr<LogSink> sink,
                                   StatisticsService& statistics)
    : levels_(levels),
      memory_(levels.kept.has_value() ? std::make_unique<LogMemory>(*levels.kept) : nullptr),
      sink_(std::move(sink)),
      received_(statistics.counter("log", "received")),
      written_(statistics.counter("log", "delivered")),
      dropped_(statistics.counter("log", "dropped: reader too slow")),
      failed_(statistics.counter("log", "dropped: not taken by the reader")),
      thread_(&QueuedLogService::run, this) {}

std::unique_ptr<QueuedLogService> QueuedLogService::onStandardError(Levels levels,
                                                                    StatisticsService& statistics) {
  std::unique_ptr<LogSink> sink = isJournalStream(STDERR_FILENO)
                                      ? makeJournalLogSink(::sd_journal_sendv)
                                      : makeTextLogSink(STDERR_FILENO);
  return std::make_unique<QueuedLogService>(levels, std::move(sink), statistics);
}

QueuedLogService::~QueuedLogService() { stop(); }

LogCategory& QueuedLogService::createCategory(std::string_view subsystem,
                                              std::string_view category) {
  std::pair<std::string, std::string> names(subsystem, category);
  const MutexLock lock(mutex_);
  std::unique_ptr<Category>& slot = categories_[names];
  if (slot == nullptr) slot = std::make_unique<Category>(*this, names.first, names.second);
  return *slot;
}

void QueuedLogService::stop() {
  // Call end() before finish(). The thread then still writes the queued lines, and finish() limits
  // its wait for a reader that does not read to one second.
  queue_.end();
  sink_->finish();
  if (thread_.joinable()) thread_.join();
}

LogMemory::Contents QueuedLogService::keptLines() const {
  return memory_ == nullptr ? LogMemory::Contents{} : memory_->contents();
}

void QueuedLogService::add(LogEntry entry) {
  received_.add();
  if (queue_.add(std::move(entry))) return;
  dropped_.add();
  unreported_.fetch_add(1, std::memory_order_relaxed);
}

void QueuedLogService::run() {
  setUpThread("log");
  std::vector<LogEntry> entries;
  while (queue_.take(entries)) {
    const std::size_t written = sink_->write(entries);
    written_.add(written);
    failed_.add(entries.size() - written);
    reportLosses();
  }
}

// The line is not counted as received, because no caller logged it.
void QueuedLogService::reportLosses() {
  const std::uint64_t lost = unreported_.exchange(0, std::memory_order_relaxed);
  if (lost == 0) return;
  std::string text = detail::logPrefix("QueuedLogService", __LINE__) + std::to_string(lost) +
                     " lines were dropped: the reader of the log is too slow";
  const std::size_t length = text.size();
  const LogEntry entry{.time = std::chrono::system_clock::now(),
                       .level = LogLevel::kError,
                       .subsystem = "com.tarno.halvox",
                       .category = "log",
                       .text = std::move(text),
                       .wholeLength = length};
  // Write directly to the sink, because the queue may be full again.
  sink_->write({&entry, 1});
}

}  // namespace halvox::platform::linux_
