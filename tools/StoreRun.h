#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <ostream>
#include <string>
#include <variant>
#include <vector>

#include "platform/linux/store/reading/EventFollower.h"
#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Command.h"
#include "tools/Complaint.h"
#include "tools/TextPattern.h"

namespace halvox::tools {

// Selects the stored records that a command shows.
struct RecordSelection {
  std::vector<std::string> names{};   // glob patterns; empty: all names
  std::optional<TextPattern> grep{};  // for names and payloads
  std::optional<double> since{};      // seconds since 1970
  std::optional<double> until{};
  std::optional<std::uint64_t> last{};
  bool follow = false;
  std::string database{};  // empty: as the service's configuration says
};

// The arguments of runOverStore() that all kinds of records share.
struct StoreRun {
  std::string command;  // for error messages
  OutputForm form;      // of error messages
  const RecordSelection& selection;
  std::ostream& out;
  int outputDescriptor;  // the descriptor of `out`
  std::ostream& errors;
};

// How records are read and printed: `all` handles those that the store has, `added` those that were
// added since.
struct StoreReading {
  using Outcome = platform::linux_::Result<void, platform::linux_::StoreError>;
  std::function<Outcome(platform::linux_::StoreReader&, const platform::linux_::RecordFilter&)> all;
  std::function<Outcome(platform::linux_::EventFollower&)> added;
};

// Converts a selection to the filter of the store's reader.
platform::linux_::RecordFilter filterOf(const RecordSelection& selection);

// Returns the directory of the store that --database named, or else the one that this user's
// programs find. Reports that there is none.
std::variant<std::filesystem::path, ExitStatus> storeDirectory(const std::string& database,
                                                               const Complaint& complain);

// Opens the selected store and reads it once or, with --follow, until the output is closed or the
// directory of the store is deleted.
ExitStatus runOverStore(const StoreRun& run, const platform::linux_::RecordFilter& filter,
                        const StoreReading& reading);

}  // namespace halvox::tools
