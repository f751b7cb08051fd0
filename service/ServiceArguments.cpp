#include "service/ServiceArguments.h"

namespace halvox {
namespace {

using Request = ServiceArguments::Request;

Request requestOf(std::string_view argument) {
  if (argument == "-h" || argument == "--help") return Request::kShowHelp;
  if (argument == "--version") return Request::kShowVersion;
  return Request::kMistake;
}

}  // namespace

ServiceArguments parseServiceArguments(std::span<const char* const> arguments) {
  ServiceArguments result;
  for (const std::string_view argument : arguments) {
    const Request request = requestOf(argument);
    if (request == Request::kMistake) {
      return {.request = Request::kMistake,
              .mistake = "expected --help, --version or no argument, found '" +
                         std::string(argument) +
                         "'; all settings are in the configuration file, see --help"};
    }
    if (result.request == Request::kServe) result.request = request;
  }
  return result;
}

std::string serviceHelp(std::string_view configurationFile) {
  return "Usage: halvox-reportingd [--help | --version]\n"
         "\n"
         "The Halvox audio reporting service. Runs until it receives SIGTERM or SIGINT. Logs its "
         "counters\n"
         "when it receives SIGUSR1.\n"
         "\n"
         "Options:\n"
         "  -h, --help  Print this help\n"
         "  --version   Print the version, the commit and the optional parts\n"
         "\n"
         "All settings are in a TOML file. Without it they have their defaults. The service\n"
         "would now read this file:\n"
         "  " +
         std::string(configurationFile) +
         "\n"
         "\n"
         "Environment:\n"
         "  HALVOX_CONFIG  The settings file, which must exist. If the variable is not set:\n"
         "                 $XDG_CONFIG_HOME/halvox/halvox.toml or, if that does not exist,\n"
         "                 /etc/halvox/halvox.toml\n"
         "\n"
         "Exit status:\n"
         "  0   stopped by SIGTERM or SIGINT\n"
         "  2   ended by a client (halvoxctl kill)\n"
         "  64  an argument is unknown\n"
         "  66  the settings file cannot be read\n"
         "  69  the socket, the store or a bus is in use or cannot be reached\n"
         "  73  the socket or the store cannot be created\n"
         "  77  no permission to give the socket to its group\n"
         "  78  a setting is wrong\n";
}

}  // namespace halvox
