#include "platform/fake/Journal.h"

#include <algorithm>
#include <ostream>
#include <utility>

namespace halvox::platform {

void Journal::record(JournalKind kind, std::string_view text) {
  std::function<void(const JournalEntry&)> handler;
  const JournalEntry entry{kind, std::string(text)};
  {
    const std::lock_guard lock(mutex_);
    entries_.push_back(entry);
    handler = handler_;
  }
  if (handler) handler(entry);
}

void Journal::whenRecorded(std::function<void(const JournalEntry&)> handler) {
  const std::lock_guard lock(mutex_);
  handler_ = std::move(handler);
}

void Journal::clear() {
  const std::lock_guard lock(mutex_);
  entries_.clear();
}

std::vector<JournalEntry> Journal::entries() const {
  const std::lock_guard lock(mutex_);
  return entries_;
}

std::vector<JournalEntry> Journal::entries(std::initializer_list<JournalKind> kinds) const {
  std::vector<JournalEntry> chosen = entries();
  std::erase_if(chosen, [kinds](const JournalEntry& entry) {
    return std::ranges::find(kinds, entry.kind) == kinds.end();
  });
  return chosen;
}

std::vector<std::string> Journal::texts() const {
  std::vector<std::string> result;
  for (JournalEntry& entry : entries()) result.push_back(std::move(entry.text));
  return result;
}

std::vector<std::string> Journal::texts(JournalKind kind) const {
  std::vector<std::string> result;
  for (JournalEntry& entry : entries({kind})) result.push_back(std::move(entry.text));
  return result;
}

void PrintTo(const JournalEntry& entry, std::ostream* stream) {
  *stream << '{' << static_cast<int>(entry.kind) << ", \"" << entry.text << "\"}";
}

}  // namespace halvox::platform
