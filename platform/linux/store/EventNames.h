#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::platform::linux_ {

// One event name, made once and kept. `isWanted` is constant; the rest belongs to the store's
// writer: the name's number in the database, good while the generations agree.
struct EventName {
  EventName(std::string_view name, bool wanted) : text(name), isWanted(wanted) {}
  const std::string text;
  const bool isWanted;
  std::int64_t databaseID = 0;
  std::uint64_t generation = 0;
};

// The event names that were seen, each with the answer to whether somebody wants it. Any thread may
// ask, without a lock: an entry is never changed or removed once it is in the table.
// Bounded: a name that finds the table full is matched anew each time.
class EventNames {
 public:
  // Glob patterns as fnmatch(3) understands them; a name is wanted when one of them matches.
  explicit EventNames(std::vector<std::string> wantedPatterns);
  EventNames(const EventNames&) = delete;
  EventNames& operator=(const EventNames&) = delete;
  ~EventNames();

  // The entry of that name, made if there is room; null when the table is full.
  [[nodiscard]] EventName* find(std::string_view name);
  // Asks the patterns.
  [[nodiscard]] bool matches(std::string_view name) const;

  static constexpr std::size_t kMostNames = 4096;

 private:
  static constexpr std::size_t kSlots = 2 * kMostNames;

  const std::vector<std::string> wantedPatterns_;
  // A slot is set once and its content read by whoever finds it: set with release, read with
  // acquire.
  std::unique_ptr<std::atomic<EventName*>[]> slots_;
  // Orders with nothing; it only stops the growth.
  std::atomic<std::size_t> count_{0};
};

}  // namespace halvox::platform::linux_
