#include "tools/SettingsDirectory.h"

#include <system_error>

#include "tools/JsonText.h"

namespace halvox::tools {

using platform::linux_::Configuration;
using platform::linux_::ConfigurationError;

std::variant<std::filesystem::path, ExitStatus> settingsDirectory(
    const std::string& named, std::filesystem::path Configuration::*configured, const char* command,
    std::ostream& errors) {
  if (!named.empty()) {
    std::error_code error;
    auto path = std::filesystem::absolute(named, error);
    if (!error) return path;
    errors << "halvoxctl " << command << ": --directory: " << harmlessText(named) << ": "
           << error.message() << '\n';
    return ExitStatus::kBadArguments;
  }
  auto loaded = platform::linux_::loadConfiguration();
  if (const auto* error = std::get_if<ConfigurationError>(&loaded)) {
    errors << "halvoxctl " << command << ": " << harmlessText(error->description) << '\n';
    return ExitStatus::kBadConfiguration;
  }
  return std::get<Configuration>(loaded).*configured;
}

}  // namespace halvox::tools
