#pragma once

#include <filesystem>
#include <string>
#include <variant>

#include "platform/linux/runtime/Configuration.h"
#include "tools/Complaint.h"

namespace halvox::tools {

// The configuration that a service of this user and environment has. When it is wrong, it is
// complained of and the exit status is what there is.
std::variant<platform::linux_::Configuration, ExitStatus> serviceConfiguration(
    const Complaint& complain);

// The directory that --directory named, or the one that the service's configuration has there.
std::variant<std::filesystem::path, ExitStatus> settingsDirectory(
    const std::string& named, std::filesystem::path platform::linux_::Configuration::*configured,
    const Complaint& complain);

}  // namespace halvox::tools
