#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/reading/RecordScan.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {

// One pass over the stored events that pass a filter, in the filter's order. Reads in pieces, and
// holds no snapshot between two pieces; StoreReader says why. Reads no event that was stored after
// it began. Belongs to the thread of its database and does not own its arguments. After an error
// the scan is over.
//
// An event's ID is twice the number of its record, plus 1 for the twin.
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

  // Finds the first and the last record to read. Call once, before next().
  [[nodiscard]] SqliteCode begin();
  // Reads the next piece. A piece may be empty although more follow. Only isAtEnd() shows the end.
  [[nodiscard]] SqliteCode next(Piece& piece);
  [[nodiscard]] bool isAtEnd() const { return bounds_.first > bounds_.last; }

  // Returns the last event that a pass in the order of storing looks at, whether or not it passes
  // the filter. Known after begin().
  [[nodiscard]] StoredRecordID last() const { return 2 * bounds_.last + 1; }

  [[nodiscard]] std::string_view nameOf(std::int64_t nameID) { return name(nameID).text; }

 private:
  struct Name {
    std::string text;
    bool matches = false;
  };

  // Reads an event from the statement's row. `which` is 0 for the record's first event and 1 for
  // its twin. Returns false if the record has no twin or the event does not pass the filter.
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
