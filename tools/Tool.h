#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace halvox::tools {

// Runs halvoxctl with these arguments, its own name not among them.
ExitStatus runTool(std::vector<std::string> arguments, const ToolStreams& streams);

}  // namespace halvox::tools
