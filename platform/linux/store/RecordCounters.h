#pragma once

#include <array>
#include <string>
#include <string_view>

#include "platform/linux/store/RecordKind.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Counts the records of one kind: received = stored + dropped (by reason) + still waiting.
// Any thread may count. The statistics service owns the counters and must outlive this object.
class RecordCounters {
 public:
  RecordCounters(StatisticsService& statistics, std::string_view piece)
      : received_(statistics.counter(piece, "received")),
        stored_(statistics.counter(piece, "stored")) {
    for (std::size_t index = 0; index < kDropReasons; ++index) {
      dropped_[index] = &statistics.counter(piece, counterName(static_cast<DropReason>(index)));
    }
  }

  void addReceived() { received_.add(); }
  void addStored(std::uint64_t count) { stored_.add(count); }
  void addDropped(DropReason reason, std::uint64_t count) {
    dropped_[static_cast<std::size_t>(reason)]->add(count);
  }

 private:
  Counter& received_;
  Counter& stored_;
  std::array<Counter*, kDropReasons> dropped_{};
};

}  // namespace halvox::platform::linux_
