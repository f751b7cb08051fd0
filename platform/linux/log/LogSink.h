#pragma once

#include <functional>
#include <memory>
#include <span>

#include <sys/uio.h>

#include "platform/linux/log/LogQueue.h"

namespace halvox::platform::linux_ {

// Where log lines go. The log's thread writes; any thread may call finish().
// Owner: the log service.
class LogSink {
 public:
  virtual ~LogSink() = default;
  // Writes the lines in order; returns how many were written. Waits for a slow reader without
  // limit, and for about one more second after finish() was called.
  virtual std::size_t write(std::span<const LogEntry> entries) = 0;
  // Limits how long write() waits from now on. May be called during write().
  virtual void finish() = 0;
};

// Writes lines of text to `descriptor`, which the caller keeps open and owns.
std::unique_ptr<LogSink> makeTextLogSink(int descriptor);

// Sends the fields of one entry to the journal: sd_journal_sendv, or a substitute in a test.
// Returns a negative number on failure.
using JournalSender = std::function<int(const iovec* fields, int count)>;

// Writes native journal entries. A line for which `sender` fails counts as not written.
std::unique_ptr<LogSink> makeJournalLogSink(JournalSender sender);

// Whether the descriptor is connected to the journal, according to $JOURNAL_STREAM
// (systemd.exec(5)).
bool isJournalStream(int descriptor);

}  // namespace halvox::platform::linux_
