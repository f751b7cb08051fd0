#pragma once

#include <optional>
#include <string>

#include "tools/Command.h"

namespace halvox::tools {

// A request to explain where messages went.
struct Explain {
  std::string target;             // the name of an event, a session's ID or a record's ID
  std::optional<double> since{};  // seconds since 1970
  std::optional<double> until{};
  std::string database{};  // empty: as the service's configuration says
};

// Prints which sinks took the messages of an event, those of a session, or one message, and why. A
// number may be the ID of a session and of a record; both are explained then. Reads the store
// twice, in bounded memory. If a service has the store open, asks it whether the session exists.
ExitStatus explain(const Explain& request, const CommonOptions& options,
                   const ToolStreams& streams);

}  // namespace halvox::tools
