#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::platform::linux_ {

// One event name. Immutable; any thread may read it.
struct EventName {
  EventName(std::string_view name, bool wanted) : text(name), isWanted(wanted) {}
  const std::string text;
  const bool isWanted;
};

// A table of the event names seen so far. Each entry says whether events of that name are stored.
// Matching the patterns for every message would be too slow. Owned by the store.
//
// Any thread may call, and no call takes a lock: entries are added but never removed, and their
// constant members never change. The table is bounded, because clients choose names. A name that
// does not fit is matched again each time.
class EventNames {
 public:
  // Patterns for fnmatch(3). A name is wanted when at least one of them matches.
  explicit EventNames(std::vector<std::string> wantedPatterns);
  EventNames(const EventNames&) = delete;
  EventNames& operator=(const EventNames&) = delete;
  ~EventNames();

  // Returns the entry of a name and adds it if needed; null when the table is full. The table owns
  // the entry, which lives as long as the table.
  [[nodiscard]] EventName* find(std::string_view name);
  // Matches the name against the patterns, without the table.
  [[nodiscard]] bool matches(std::string_view name) const;

  static constexpr std::size_t kMostNames = 4096;

 private:
  // Twice the names: half of the slots stay empty, which keeps a search short and makes it end.
  static constexpr std::size_t kSlots = 2 * kMostNames;

  const std::vector<std::string> wantedPatterns_;
  // Each slot is set once. Storing with release and loading with acquire make the entry's content
  // visible to every thread that finds it.
  std::unique_ptr<std::atomic<EventName*>[]> slots_;
  // Bounds the growth. Relaxed: no other memory is published through it.
  std::atomic<std::size_t> count_{0};
};

}  // namespace halvox::platform::linux_
