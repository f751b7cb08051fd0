#pragma once

#include <cstdint>
#include <deque>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "analysis/Payload.h"

#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::tools {

// Selects the records of applications: events and power events that name one, issue metrics of a
// client with that name, and link messages. A link message does not name its application: it has
// that of the event with the same stamp, or if there is none, that of its session's last message.
// No snapshot belongs to an application. Belongs to one thread.
//
//   accepts() for each record, in the order of storing
class ApplicationFilter {
 public:
  // The link records a message at most seconds after its events.
  static constexpr std::size_t kMostStamps = 65'536;
  static constexpr std::size_t kMostSessions = 65'536;

  // `patterns` are for fnmatch(3). Without any, every record is accepted.
  explicit ApplicationFilter(std::vector<std::string> patterns) : patterns_(std::move(patterns)) {}

  [[nodiscard]] bool accepts(const platform::linux_::StoredItem& item);

 private:
  [[nodiscard]] bool matches(std::string_view application) const;
  [[nodiscard]] bool acceptsEvent(const platform::linux_::StoredItem& item);
  [[nodiscard]] bool acceptsLinkMessage(const platform::linux_::StoredItem& item);
  void note(std::uint64_t stamp, bool isAccepted);

  const std::vector<std::string> patterns_;
  analysis::Payload payload_;
  std::unordered_map<std::uint64_t, bool> stamps_;  // of events: whether they were accepted
  std::deque<std::uint64_t> oldest_;                // of stamps_, in order
  std::unordered_map<std::int64_t, bool> sessions_;
};

}  // namespace halvox::tools
