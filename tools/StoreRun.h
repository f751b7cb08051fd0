#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "platform/linux/store/reading/EventFollower.h"
#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Command.h"

namespace halvox::tools {

// Which stored records a command shows.
struct RecordSelection {
  std::vector<std::string> names{};  // glob patterns; none: all
  std::optional<double> since{};     // seconds since 1970
  std::optional<double> until{};
  std::optional<std::uint64_t> last{};
  bool follow = false;
  std::string database{};  // empty: where the service's configuration puts it
};

// What a command that shows stored records of one kind is run with.
struct StoreRun {
  std::string command;  // for the complaints
  OutputForm form;      // of the complaints
  const RecordSelection& selection;
  std::ostream& out;
  int outputDescriptor;  // what `out` writes to
  std::ostream& errors;
};

// How the records are read and printed: all that are there, or those that are new.
struct StoreReading {
  using Error = std::optional<platform::linux_::StoreError>;
  std::function<Error(platform::linux_::StoreReader&, const platform::linux_::RecordFilter&)> all;
  std::function<Error(platform::linux_::EventFollower&)> added;
};

// What the selection asks for, as the store's reader has it.
platform::linux_::RecordFilter filterOf(const RecordSelection& selection);

// Opens the store that the selection names and reads it, once or, with --follow, until the output
// is closed or the store's directory is gone.
ExitStatus runOverStore(const StoreRun& run, const platform::linux_::RecordFilter& filter,
                        const StoreReading& reading);

}  // namespace halvox::tools
