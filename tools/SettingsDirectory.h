#pragma once

#include <filesystem>
#include <ostream>
#include <string>
#include <variant>

#include "platform/linux/runtime/Configuration.h"
#include "tools/Command.h"

namespace halvox::tools {

// The directory that was named, or the one that the service's configuration has there. `command` is
// for the message.
std::variant<std::filesystem::path, ExitStatus> settingsDirectory(
    const std::string& named, std::filesystem::path platform::linux_::Configuration::*configured,
    const char* command, std::ostream& errors);

}  // namespace halvox::tools
