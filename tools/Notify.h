#pragma once

#include <ostream>
#include <string>

#include "tools/Command.h"

namespace halvox::tools {

// A request to post a notification.
struct PostNotification {
  std::string name{};
  std::string directory{};  // empty: as the service's configuration says
};

// Posts a notification: touches the file of that name in the directory that the service watches.
// Creates a missing directory. The service need not run.
ExitStatus postNotification(const PostNotification& request, OutputForm form, std::ostream& out,
                            std::ostream& errors);

}  // namespace halvox::tools
