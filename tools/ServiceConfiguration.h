#pragma once

#include <filesystem>
#include <string>
#include <variant>

#include "platform/linux/configuration/Configuration.h"
#include "tools/Complaint.h"

namespace halvox::tools {

// Returns the configuration of the service that this user's programs find. If it names no storage
// directory, the result has the first of the user's and the system's directory that holds a store,
// or the user's if neither does. If the configuration is wrong, reports it and returns the exit
// status.
std::variant<platform::linux_::Configuration, ExitStatus> serviceConfiguration(
    const Complaint& complain);

// Returns the socket that `options`, $HALVOX_SOCKET or the configuration names; empty if none does,
// and the client then tries the usual places. Reads the configuration only if the others name
// nothing. A configuration that this user may not read names nothing; a wrong one is reported.
std::variant<std::string, ExitStatus> namedSocket(const CommonOptions& options,
                                                  const Complaint& complain);

// What the configuration switches on. Both are off unless it names them.
[[nodiscard]] bool isInternalBuild(const platform::linux_::Configuration& configuration);
[[nodiscard]] bool isTracingOn(const platform::linux_::Configuration& configuration);

// Returns the directory of the store: the one that the configuration names, without looking at it,
// else the user's if it holds a store, else the system's if that holds one. If there is none,
// reports all places that were tried.
std::variant<std::filesystem::path, ExitStatus> findStore(const Complaint& complain);

// Returns the directory that --directory named, or else the configured one.
std::variant<std::filesystem::path, ExitStatus> settingsDirectory(
    const std::string& named, std::filesystem::path platform::linux_::Configuration::*configured,
    const Complaint& complain);

}  // namespace halvox::tools
