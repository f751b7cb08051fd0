#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/linux/base/Result.h"
#include "tools/Command.h"

namespace halvox::tools {

// What to delete from the store. At least one limit is set.
struct VacuumStore {
  std::optional<double> before{};  // seconds since 1970
  std::optional<std::uint64_t> toBytes{};
};

// Deletes stored records and gives their space back: asks the service to do it or, if none runs,
// does it in its place. Shows the progress if the errors go to a terminal. Blocks until the end.
ExitStatus vacuumStore(const VacuumStore& request, const CommonOptions& options,
                       const ToolStreams& streams);

// Parses a number of bytes: 1048576, 1024K, 100M, 2G. The units are powers of 1,024.
platform::linux_::Result<std::uint64_t> parseBytes(std::string_view text);

}  // namespace halvox::tools
