#include "tools/ServiceConfiguration.h"

#include <system_error>
#include <utility>

namespace halvox::tools {

using platform::linux_::Configuration;
using platform::linux_::ConfigurationError;

std::variant<Configuration, ExitStatus> serviceConfiguration(const Complaint& complain) {
  auto loaded = platform::linux_::loadConfiguration();
  if (const auto* error = std::get_if<ConfigurationError>(&loaded)) {
    return complain(ExitStatus::kBadConfiguration, error->description);
  }
  return std::get<Configuration>(std::move(loaded));
}

std::variant<std::filesystem::path, ExitStatus> settingsDirectory(
    const std::string& named, std::filesystem::path Configuration::*configured,
    const Complaint& complain) {
  if (!named.empty()) {
    std::error_code error;
    auto path = std::filesystem::absolute(named, error);
    if (!error) return path;
    return complain(ExitStatus::kBadArguments, "--directory: " + named + ": " + error.message());
  }
  auto configuration = serviceConfiguration(complain);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  return std::get<Configuration>(configuration).*configured;
}

}  // namespace halvox::tools
