#include "platform/linux/log/LogLineFormatter.h"

#include <array>
#include <ctime>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_ {

// localtime_r() and strftime() together cost more than the rest of a line. Lines of the same second
// share their result.
void LogLineFormatter::setSecond(std::chrono::sys_seconds second) {
  const std::time_t time = std::chrono::system_clock::to_time_t(second);
  std::tm local{};
  ::localtime_r(&time, &local);
  std::array<char, 64> text;
  second_ = second;
  secondText_.assign(text.data(),
                     std::strftime(text.data(), text.size(), "%Y-%m-%dT%H:%M:%S.", &local));
  zoneText_.assign(text.data(), std::strftime(text.data(), text.size(), "%z ", &local));
  zoneText_.insert(zoneText_.size() - sizeof("00"), 1, ':');  // strftime() writes +0200
}

std::string_view LogLineFormatter::format(const LogEntry& entry) {
  const auto time = std::chrono::floor<std::chrono::milliseconds>(entry.time);
  const auto second = std::chrono::floor<std::chrono::seconds>(time);
  if (second != second_) setSecond(second);
  const auto milliseconds = static_cast<unsigned>((time - second).count());
  line_ = secondText_;
  for (const unsigned unit : {100U, 10U, 1U}) {
    line_ += static_cast<char>('0' + milliseconds / unit % 10);
  }
  line_ += zoneText_;
  line_ += levelName(entry.level);
  line_ += " [";
  line_ += entry.subsystem;
  line_ += ':';
  line_ += entry.category;
  line_ += "] ";
  appendLogLineText(line_, entry);
  line_ += '\n';
  return line_;
}

void appendLogLineText(std::string& line, const LogEntry& entry) {
  const std::size_t taken = appendEscaped(line, entry.text, kLongestLogLine);
  if (taken < entry.wholeLength) {
    line += "… (" + std::to_string(entry.wholeLength - taken) + " bytes more)";
  }
}

}  // namespace halvox::platform::linux_
