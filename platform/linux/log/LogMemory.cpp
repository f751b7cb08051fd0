#include "platform/linux/log/LogMemory.h"

#include <algorithm>

#include "platform/linux/log/LogLineFormatter.h"

namespace halvox::platform::linux_ {

LogMemory::LogMemory(LogLevel level, Bounds bounds)
    : level_(level), bounds_(bounds), ring_(std::make_unique_for_overwrite<char[]>(bounds.bytes)) {
  lines_.reserve(bounds_.lines);
}

void LogMemory::add(const LogEntry& entry, std::string_view line) {
  const MutexLock lock(mutex_);
  line = line.substr(0, bounds_.bytes);
  // A text is never split: if it does not fit before the end of the ring, the rest of the ring
  // stays unused.
  const std::uint64_t room = bounds_.bytes - end_ % bounds_.bytes;
  if (room < line.size()) end_ += room;
  // Drop the lines that the new text overwrites, and those in the unused rest.
  const std::uint64_t end = end_ + line.size();
  while (firstLine_ != endLine_ &&
         (lines_[firstLine_ % bounds_.lines].begin + bounds_.bytes < end ||
          endLine_ - firstLine_ == bounds_.lines)) {
    ++firstLine_;
  }
  line.copy(&ring_[end_ % bounds_.bytes], line.size());
  if (lines_.size() < bounds_.lines) lines_.emplace_back();
  lines_[endLine_ % bounds_.lines] = {.time = entry.time,
                                      .subsystem = entry.subsystem,
                                      .category = entry.category,
                                      .begin = end_,
                                      .length = line.size(),
                                      .wholeLength = entry.wholeLength,
                                      .level = entry.level};
  ++endLine_;
  end_ = end;
}

LogMemory::Contents LogMemory::contents() const {
  std::vector<Line> lines;
  std::string ring;
  Contents contents;
  // Allocate memory for the largest contents before taking the lock, because threads that log must
  // not wait for an allocation.
  lines.reserve(bounds_.lines);
  ring.reserve(bounds_.bytes);
  {
    const MutexLock lock(mutex_);
    for (std::uint64_t at = firstLine_; at != endLine_; ++at) {
      lines.push_back(lines_[at % bounds_.lines]);
    }
    ring.assign(ring_.get(), std::min<std::uint64_t>(end_, bounds_.bytes));
    contents.added = endLine_;
  }
  contents.lines = lines.size();
  // Format after releasing the lock, because formatting 10,000 lines takes longer than copying
  // them.
  LogLineFormatter formatter;
  for (const Line& line : lines) {
    contents.text += formatter.format({.time = line.time,
                                       .level = line.level,
                                       .subsystem = line.subsystem,
                                       .category = line.category,
                                       .text = ring.substr(line.begin % bounds_.bytes, line.length),
                                       .wholeLength = line.wholeLength});
  }
  return contents;
}

}  // namespace halvox::platform::linux_
