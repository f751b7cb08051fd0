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

// A table of the event names seen so far. Each entry says whether events of that name are stored,
// because matching the patterns for every message would be too slow. Owned by the store.
//
// Any thread may call. No call takes a lock, because entries are added but never removed, and their
// members are constant. The table is bounded, because clients choose the names. A name for which no
// slot is left is matched again each time.
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
  // Twice as many slots as names. At least about half of the slots stay empty, which keeps searches
  // short. A search ends at an empty slot.
  static constexpr std::size_t kSlots = 2 * kMostNames;

  const std::vector<std::string> wantedPatterns_;
  // Each slot is set once. It is stored with release and loaded with acquire, and a thread that
  // finds an entry therefore sees the entry's content.
  std::unique_ptr<std::atomic<EventName*>[]> slots_;
  // Bounds the number of entries. Relaxed, because it publishes no other memory.
  std::atomic<std::size_t> count_{0};
};

}  // namespace halvox::platform::linux_
