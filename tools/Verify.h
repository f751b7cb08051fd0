#pragma once

#include <string>

#include "tools/Command.h"

namespace halvox::tools {

struct VerifyStore {
  std::string database{};  // empty: as the service's configuration says
};

// Verifies the store, its captures and its summary files against each other, and prints each
// difference with its place, then what was read. Returns kRefused if there is a difference.
ExitStatus verifyStore(const VerifyStore& request, const CommonOptions& options,
                       const ToolStreams& streams);

}  // namespace halvox::tools
