#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "platform/linux/store/RecordScan.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreReader.h"

namespace halvox::platform::linux_ {

// One pass over the stored events that match a filter, in pieces, so that no snapshot is held
// between them. Ends with what was stored when it began. Belongs to the thread of its database,
// which it does not own.
class EventScan {
 public:
  struct Event {
    StoredRecordID id;
    double time;
    std::int64_t nameID;
    std::size_t payload;  // index in Piece::payloads
  };
  struct Piece {
    std::vector<Event> events;
    std::vector<std::string> payloads;
  };

  EventScan(Database& database, const RecordFilter& filter)
      : database_(database), filter_(filter), after_(filter.after) {}

  // Finds where to begin and to end.
  [[nodiscard]] SqliteCode begin();
  // Reads on. A piece may be empty though more follow.
  [[nodiscard]] SqliteCode next(Piece& piece);
  [[nodiscard]] bool isAtEnd() const { return bounds_.first > bounds_.last; }

  [[nodiscard]] std::string_view nameOf(std::int64_t nameID) { return name(nameID).text; }

 private:
  struct Name {
    std::string text;
    bool matches = false;
  };

  // The event in the statement's row: 0 the record's first, 1 its twin. False when there is none
  // or the filter does not let it through.
  [[nodiscard]] bool readEvent(const Statement& row, int which, Event& event);
  [[nodiscard]] bool passes(const Event& event);
  [[nodiscard]] const Name& name(std::int64_t nameID);
  [[nodiscard]] SqliteCode skipToNewest(std::uint64_t count);

  Database& database_;
  const RecordFilter& filter_;
  StoredRecordID after_;
  RecordBounds bounds_;
  std::map<std::int64_t, Name> names_;
  Statement read_;
};

}  // namespace halvox::platform::linux_
