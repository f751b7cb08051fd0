#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <memory>
#include <variant>

#include <sysexits.h>

#include "platform/connection.h"
#include "platform/linux/LinuxPlatform.h"
#include "platform/linux/runtime/Configuration.h"
#include "platform/services.h"
#include "service/HVReportingServiceDelegate.h"

namespace {

using namespace halvox;
using platform::linux_::Configuration;
using platform::linux_::ConfigurationError;
using platform::linux_::LinuxPlatform;

int refuse(int exitStatus, const std::string& why) {
  std::fprintf(stderr, "halvox-reportingd: %s\n", why.c_str());
  return exitStatus;
}

int serve(const Configuration& configuration) {
  LinuxPlatform adapters(configuration);
  platform::installServices(adapters.services());
  if (const auto failure = adapters.open()) {
    (void)adapters.close();
    return refuse(failure->exitStatus, failure->description);
  }
  const auto delegate = std::make_shared<HVReportingServiceDelegate>();
  platform::NSXPCListener& listener = platform::connections().serviceListener();
  listener.setDelegate(*delegate);
  listener.resume();
  if (!adapters.close()) std::quick_exit(EXIT_SUCCESS);
  return EXIT_SUCCESS;
}

int run(int argumentCount, char** arguments) {
  if (argumentCount > 1) {
    return refuse(EX_USAGE, std::string("unexpected argument '") + arguments[1] +
                                "': all settings are in the configuration file, " +
                                platform::linux_::configurationPath().string());
  }
  const auto loaded = platform::linux_::loadConfiguration();
  if (const auto* error = std::get_if<ConfigurationError>(&loaded)) {
    const bool wrong = error->kind == ConfigurationError::Kind::kWrong;
    return refuse(wrong ? EX_CONFIG : EX_NOINPUT, error->description);
  }
  return serve(std::get<Configuration>(loaded));
}

}  // namespace

int main(int argc, char** argv) {
  // A reader of the log that went away and a file that may not grow are errors to count, no ends.
  std::signal(SIGPIPE, SIG_IGN);
  std::signal(SIGXFSZ, SIG_IGN);
  try {
    return run(argc, argv);
  } catch (const std::exception& error) {
    return refuse(EX_SOFTWARE, error.what());
  }
}
