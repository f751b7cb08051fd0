#pragma once

#include <istream>
#include <ostream>
#include <string>
#include <vector>

#include "tools/Command.h"

namespace halvox::tools {

// What a program has to read from and write to.
struct ToolStreams {
  std::istream& input;
  std::ostream& output;
  std::ostream& errors;
  int outputDescriptor = -1;  // what `output` writes to
  bool isInputTerminal = false;
};

// Runs halvoxctl with these arguments, its own name not among them.
ExitStatus runTool(std::vector<std::string> arguments, const ToolStreams& streams);

}  // namespace halvox::tools
