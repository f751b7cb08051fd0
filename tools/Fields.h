#pragma once

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "tools/Command.h"

namespace halvox::tools {

// A request for the keys of stored records. An empty list stands for all.
struct ShowFields {
  std::vector<std::string> applications{};  // glob patterns; only events name an application
  std::vector<std::uint32_t> categories{};  // one without a domain stands for all domains
  std::vector<std::uint16_t> types{};
  std::optional<double> since{};  // seconds since 1970
  std::optional<double> until{};
  std::string database{};  // empty: as the service's configuration says
};

// Prints a table of the keys that occur in the selected records, in the order of their bytes, or a
// JSON object for each on a line. Reads the store in one pass and bounded memory. Keys beyond the
// bounds of the collector are counted on `errors`. At a terminal the table fits its width.
// `outputDescriptor` is the descriptor of `out`.
ExitStatus showFields(const ShowFields& request, OutputForm form, std::ostream& out,
                      int outputDescriptor, std::ostream& errors);

}  // namespace halvox::tools
