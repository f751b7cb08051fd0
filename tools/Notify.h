#pragma once

#include <ostream>
#include <string>

#include "tools/Command.h"

namespace halvox::tools {

struct PostNotification {
  std::string name{};
  std::string directory{};  // empty: where the service's configuration puts it
};

// Posts a notification to the service: touches the file of that name in the directory where it
// looks for them, which is made when it is missing. Does not need the service to run.
ExitStatus postNotification(const PostNotification& request, OutputForm form, std::ostream& out,
                            std::ostream& errors);

}  // namespace halvox::tools
