#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <memory>
#include <span>
#include <string>

#include <sysexits.h>

#include "platform/connection.h"
#include "platform/linux/LinuxPlatform.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/version/Commit.h"
#include "platform/linux/version/VersionText.h"
#include "platform/services.h"
#include "service/HVReportingServiceDelegate.h"
#include "service/ReportingQueue.h"
#include "service/ServiceArguments.h"

namespace {

using namespace halvox;
using platform::linux_::Configuration;
using platform::linux_::ConfigurationError;
using platform::linux_::halvoxCommit;
using platform::linux_::LinuxPlatform;
using platform::linux_::serviceParts;
using platform::linux_::versionText;

int refuse(int exitStatus, const std::string& why) {
  std::fprintf(stderr, "halvox-reportingd: %s\n", why.c_str());
  return exitStatus;
}

int serve(const Configuration& configuration) {
  LinuxPlatform adapters(configuration);
  platform::installServices(adapters.services());
  // All requests are carried out on this queue. A service in which it is stuck serves nobody.
  adapters.watchQueue(gReportingQueueName);
  if (const auto opened = adapters.open(); !opened) {
    static_cast<void>(adapters.close());
    return refuse(opened.error().code, opened.error().message);
  }
  // The constructor uses the installed services. No connection is accepted before resume(), which
  // returns when the service is asked to end.
  const auto delegate = std::make_shared<HVReportingServiceDelegate>();
  platform::NSXPCListener& listener = platform::connections().serviceListener();
  listener.setDelegate(*delegate);
  listener.resume();
  // Nothing is destroyed, because a thread that did not end may still use the adapters.
  if (!adapters.close()) std::quick_exit(EXIT_SUCCESS);
  return EXIT_SUCCESS;
}

int print(const std::string& text) {
  const bool isWritten = std::fputs(text.c_str(), stdout) >= 0 && std::fflush(stdout) == 0;
  return isWritten ? EXIT_SUCCESS : refuse(EX_IOERR, "cannot write to standard output");
}

int configureAndServe() {
  const auto loaded = platform::linux_::loadConfiguration();
  if (loaded) return serve(*loaded);
  const bool wrong = loaded.error().code == ConfigurationError::kWrong;
  return refuse(wrong ? EX_CONFIG : EX_NOINPUT, loaded.error().message);
}

int run(std::span<const char* const> arguments) {
  using Request = ServiceArguments::Request;
  const ServiceArguments parsed = parseServiceArguments(arguments);
  switch (parsed.request) {
    case Request::kServe:
      return configureAndServe();
    case Request::kShowHelp:
      return print(serviceHelp(platform::linux_::configurationPath().string()));
    case Request::kShowVersion:
      return print(versionText("halvox-reportingd", halvoxCommit(), serviceParts()) + "\n");
    case Request::kMistake:
      return refuse(EX_USAGE, parsed.mistake);
  }
  return EX_SOFTWARE;
}

}  // namespace

int main(int argc, char** argv) {
  // When the reader of a pipe has closed it or a file is at its size limit, the write fails and is
  // counted. By default these signals would end the process instead.
  std::signal(SIGPIPE, SIG_IGN);
  std::signal(SIGXFSZ, SIG_IGN);
  try {
    return run(std::span<const char* const>(argv, static_cast<std::size_t>(argc)).subspan(1));
  } catch (const std::exception& error) {
    return refuse(EX_SOFTWARE, error.what());
  }
}
