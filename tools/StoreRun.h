#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <ostream>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/store/reading/EventFollower.h"
#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Command.h"
#include "tools/Complaint.h"
#include "tools/RowCursor.h"
#include "tools/RowPrinter.h"
#include "tools/TextPattern.h"

namespace halvox::tools {

// Selects the stored records that a command shows.
struct RecordSelection {
  std::vector<std::string> names{};   // glob patterns; empty: all names
  std::optional<TextPattern> grep{};  // for names and payloads
  std::optional<double> since{};      // seconds since 1970
  std::optional<double> until{};
  std::optional<std::uint64_t> last{};
  // Begin with this row, or after it, in the order of showing. At most one of the two is set.
  std::optional<RowCursor> cursor{};
  std::optional<RowCursor> afterCursor{};
  bool isReversed = false;  // newest first
  bool follow = false;
  bool isUtc = false;       // the times; otherwise local
  bool isFull = false;      // cut no text at a terminal
  bool showCursor = false;  // after the last row
  bool usePager = true;     // at a terminal
  std::string database{};   // empty: as the service's configuration says
};

// The arguments of runOverStore() that all kinds of records share.
struct StoreRun {
  std::string command;  // for error messages and cursors
  OutputForm form;
  const RecordSelection& selection;
  std::ostream& out;
  int outputDescriptor;  // the descriptor of `out`
  std::ostream& errors;
};

// How the records of one kind are read and printed. Belongs to one thread.
class StoreReading {
 public:
  using Outcome = platform::linux_::Result<void, platform::linux_::StoreError>;
  using RowCallback = std::function<void(platform::linux_::StoredRecordID id, double time)>;

  StoreReading() = default;
  StoreReading(const StoreReading&) = delete;
  StoreReading& operator=(const StoreReading&) = delete;
  virtual ~StoreReading() = default;

  // Gives the number and the time of each record.
  virtual Outcome find(platform::linux_::StoreReader& reader,
                       const platform::linux_::RecordFilter& filter,
                       const RowCallback& callback) = 0;
  // Called once, before the first record is printed, with the row after which --after-cursor
  // begins. May change the filter.
  virtual Outcome prepare(platform::linux_::StoreReader& /*reader*/,
                          std::optional<platform::linux_::StoredRecordID> shownBefore,
                          platform::linux_::RecordFilter& filter);
  // Prints the records that the store has.
  virtual Outcome printAll(platform::linux_::StoreReader& reader,
                           const platform::linux_::RecordFilter& filter, RowPrinter& printer) = 0;
  // Prints those that were added since the last call.
  virtual Outcome printAdded(platform::linux_::EventFollower& follower, RowPrinter& printer) = 0;
};

// Converts a selection to the filter of the store's reader.
platform::linux_::RecordFilter filterOf(const RecordSelection& selection);

// Returns the directory of the store that an option named, or else the one that this user's
// programs find. Reports that there is none; `option` is the one to blame.
std::variant<std::filesystem::path, ExitStatus> storeDirectory(
    const std::string& database, const Complaint& complain, std::string_view option = "--database");

// Opens the selected store and prints its records once or, with --follow, until the output is
// closed or the directory of the store is deleted. At a terminal, prints into a pager unless it
// follows.
ExitStatus runOverStore(const StoreRun& run, platform::linux_::RecordFilter filter,
                        StoreReading& reading);

}  // namespace halvox::tools
