#pragma once

#include <functional>
#include <memory>
#include <span>

#include <sys/uio.h>

#include "platform/linux/log/LogQueue.h"

namespace halvox::platform::linux_ {

// Takes lines from the thread that writes the log.
class LogSink {
 public:
  virtual ~LogSink() = default;
  // Writes the lines in order and returns how many of them reached the reader. May wait for the
  // reader until finish() is called from another thread, and about a second after that.
  virtual std::size_t write(std::span<const LogEntry> entries) = 0;
  virtual void finish() = 0;
};

// Lines of text on a descriptor, which is not owned.
std::unique_ptr<LogSink> makeTextLogSink(int descriptor);

// What sends fields to the journal: sd_journal_sendv, or what stands for it in a test.
using JournalSender = std::function<int(const iovec* fields, int count)>;

// Native journal entries. A line that the journal does not take counts as not written.
std::unique_ptr<LogSink> makeJournalLogSink(JournalSender sender);

// True when $JOURNAL_STREAM says that what is written to that descriptor goes to the journal.
bool isJournalStream(int descriptor);

}  // namespace halvox::platform::linux_
