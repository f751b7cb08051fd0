#pragma once

#include "tools/Command.h"

namespace halvox::tools {

// A request for the state of the service.
struct ShowStatus {};

// Shows whether the service runs, where its files are, what it has done and lost, what it uses and
// what is switched off. Without a service, shows what its files and its configuration say, and
// returns kNoService.
ExitStatus showStatus(const ShowStatus& request, const CommonOptions& options,
                      const ToolStreams& streams);

}  // namespace halvox::tools
