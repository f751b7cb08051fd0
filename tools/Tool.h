#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace halvox::tools {

// Runs halvoxctl with these arguments, which do not include its own name. `version` is the text of
// --version. Throws nothing that a user can cause.
ExitStatus runTool(std::vector<std::string> arguments, const std::string& version,
                   const ToolStreams& streams);

}  // namespace halvox::tools
