#pragma once

#include <ostream>

#include "tools/Command.h"

namespace halvox::tools {

// Posts a notification to the service: touches the file of that name in the directory where it
// looks for them, which is made when it is missing. Does not need the service to run.
ExitStatus postNotification(const PostNotification& request, std::ostream& errors);

}  // namespace halvox::tools
