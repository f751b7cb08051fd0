#pragma once

#include <filesystem>
#include <string>
#include <variant>

#include "platform/linux/configuration/Configuration.h"
#include "tools/Complaint.h"

namespace halvox::tools {

// The configuration of the service that this user's programs find. A storage directory that it does
// not name is the user's when there is a store in that, else the system's when there is one in
// that, else the user's. When the configuration is wrong, it is complained of and the exit status
// is what there is.
std::variant<platform::linux_::Configuration, ExitStatus> serviceConfiguration(
    const Complaint& complain);

// The socket that `options` or the configuration names; empty when neither does, so that the client
// looks in the usual places. A configuration that the system keeps from this user's eyes names
// none; a wrong one is complained of. The configuration is only read when nothing before it names
// one.
std::variant<std::string, ExitStatus> namedSocket(const CommonOptions& options,
                                                  const Complaint& complain);

// The directory of the store that the configuration names, else of the first of the user's and the
// system's that is there. When there is none, all places are complained of. One that is named is
// not looked at.
std::variant<std::filesystem::path, ExitStatus> findStore(const Complaint& complain);

// The directory that --directory named, or the one that the service's configuration has there.
std::variant<std::filesystem::path, ExitStatus> settingsDirectory(
    const std::string& named, std::filesystem::path platform::linux_::Configuration::*configured,
    const Complaint& complain);

}  // namespace halvox::tools
