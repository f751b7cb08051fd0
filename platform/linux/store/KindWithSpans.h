#pragma once

#include <optional>
#include <string_view>

#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/RecordSpans.h"

namespace halvox::platform::linux_ {

// A kind whose records have numbers and spans, from which retention is answered. Threads, owner and
// failures are those of RecordKind.
class KindWithSpans : public RecordKind {
 public:
  // The names of the kind's tables. Pass constants, because the names are not copied.
  KindWithSpans(std::string_view records, std::string_view spans) : spans_(records, spans) {}

  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time) final {
    return spans_.oldestTime(time);
  }
  [[nodiscard]] SqliteCode deleteOldest(bool& found) final { return spans_.deleteOldest(found); }
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found) final {
    return spans_.deleteOlderThan(time, found);
  }
  [[nodiscard]] SqliteCode erase(Database& database, ErasePass& pass, bool& more) final {
    return spans_.erase(database, pass, more);
  }

 protected:
  [[nodiscard]] RecordSpans& spans() { return spans_; }

 private:
  RecordSpans spans_;
};

}  // namespace halvox::platform::linux_
