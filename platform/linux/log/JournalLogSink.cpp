#include <algorithm>
#include <array>
#include <charconv>
#include <cstdint>
#include <cstdlib>
#include <string_view>
#include <utility>

#include <sys/stat.h>
#include <syslog.h>

#include "platform/linux/log/LogLineFormatter.h"
#include "platform/linux/log/LogSink.h"
#include "platform/linux/log/MessageIds.h"

namespace halvox::platform::linux_ {
namespace {

int priority(LogLevel level) {
  switch (level) {
    case LogLevel::kDebug:
      return LOG_DEBUG;
    case LogLevel::kInfo:
      return LOG_INFO;
    case LogLevel::kDefault:
      return LOG_NOTICE;
    case LogLevel::kError:
      return LOG_ERR;
  }
  return LOG_ERR;
}

// Sends each line as one entry of named fields. Entries go into the buffer of journald's socket.
// write() therefore blocks only while journald itself hangs, and finish() does nothing.
class JournalLogSink final : public LogSink {
 public:
  explicit JournalLogSink(JournalSender sender) : sender_(std::move(sender)) {}

  std::size_t write(std::span<const LogEntry> entries) override {
    return static_cast<std::size_t>(
        std::ranges::count_if(entries, [this](const LogEntry& entry) { return send(entry); }));
  }
  void finish() override {}

 private:
  bool send(const LogEntry& entry) {
    std::string message = "MESSAGE=";
    appendLogLineText(message, entry);
    const std::string_view id = messageId(entry.text);
    // The last field is sent only for lines that the journal's catalog explains.
    std::array<std::string, 5> fields{
        std::move(message),
        "PRIORITY=" + std::to_string(priority(entry.level)),
        "HALVOX_SUBSYSTEM=" + std::string(entry.subsystem),
        "HALVOX_CATEGORY=" + std::string(entry.category),
        "MESSAGE_ID=" + std::string(id),
    };
    const std::size_t count = id.empty() ? fields.size() - 1 : fields.size();
    std::array<iovec, fields.size()> vectors{};
    std::ranges::transform(fields, vectors.begin(), [](std::string& field) {
      return iovec{field.data(), field.size()};
    });
    return sender_(vectors.data(), static_cast<int>(count)) >= 0;
  }

  const JournalSender sender_;
};

}  // namespace

std::unique_ptr<LogSink> makeJournalLogSink(JournalSender sender) {
  return std::make_unique<JournalLogSink>(std::move(sender));
}

bool isJournalStream(int descriptor) {
  const char* variable = std::getenv("JOURNAL_STREAM");
  if (variable == nullptr) return false;
  const std::string_view text(variable);
  const char* const end = text.data() + text.size();
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  const auto first = std::from_chars(text.data(), end, device);
  if (first.ec != std::errc{} || first.ptr == end || *first.ptr != ':') return false;
  const auto second = std::from_chars(first.ptr + 1, end, inode);
  if (second.ec != std::errc{} || second.ptr != end) return false;
  struct stat status {};
  // Compare the descriptor's file with the one that the variable names, because programs also
  // inherit the variable if their standard error is something else, such as a file.
  return ::fstat(descriptor, &status) == 0 && status.st_dev == device && status.st_ino == inode;
}

}  // namespace halvox::platform::linux_
