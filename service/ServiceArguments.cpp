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
              .mistake = "expected --help, --version or nothing, found '" + std::string(argument) +
                         "'; all settings are in the configuration file, see --help"};
    }
    if (result.request == Request::kServe) result.request = request;
  }
  return result;
}

std::string serviceHelp(std::string_view configurationFile) {
  return "Usage: halvox-reportingd [--help | --version]\n"
         "\n"
         "The Halvox audio reporting service. Serves until it gets SIGTERM or SIGINT; logs its "
         "counters\n"
         "at SIGUSR1.\n"
         "\n"
         "Options:\n"
         "  -h, --help  Print this help\n"
         "  --version   Print the version\n"
         "\n"
         "All settings are in a TOML file, which may be missing. Here it is\n"
         "  " +
         std::string(configurationFile) +
         "\n"
         "\n"
         "Environment:\n"
         "  HALVOX_CONFIG  The file of settings, which must then exist. Without it,\n"
         "                 $XDG_CONFIG_HOME/halvox/halvox.toml or, if that does not exist,\n"
         "                 /etc/halvox/halvox.toml\n"
         "\n"
         "Exit status:\n"
         "  0   ended when it was asked to\n"
         "  2   ended by a client (halvoxctl kill)\n"
         "  64  an unknown argument\n"
         "  66  the file of settings cannot be read\n"
         "  69  the socket, the store or a bus is in use or cannot be reached\n"
         "  73  the socket or the store cannot be made\n"
         "  77  the socket may not be given to its group\n"
         "  78  the settings are wrong\n";
}

}  // namespace halvox
