#pragma once

#include <ostream>

#include "tools/Command.h"

namespace halvox::tools {

// Shows or changes settings that the service follows while it runs. Works on the files, so it does
// not need the service to run. What there is nothing of (to get or to unset) is kRefused.
ExitStatus showOrChangePreferences(const Preferences& request, bool json, std::ostream& out,
                                   std::ostream& errors);

}  // namespace halvox::tools
