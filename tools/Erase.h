#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/base/Result.h"
#include "tools/Command.h"

namespace halvox::tools {

// What to erase from the store. Exactly one member is set.
struct EraseStored {
  std::optional<std::string> application{};
  std::optional<std::int64_t> session{};
  std::optional<double> before{};  // seconds since 1970
};

// Erases from all files of the store: asks the service to do it or, if none runs, does it in its
// place. Shows the progress if the errors go to a terminal. Blocks until the end.
ExitStatus eraseStored(const EraseStored& request, const CommonOptions& options,
                       const ToolStreams& streams);

// Checks the name of an application. It is not a pattern, so that nothing else can be meant.
platform::linux_::Result<std::string> parseErasedApplication(std::string_view text);
// Parses the number of a session, which is not 0.
platform::linux_::Result<std::int64_t> parseErasedSession(std::string_view text);

}  // namespace halvox::tools
