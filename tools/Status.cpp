#include "tools/Status.h"

#include <string>
#include <variant>

#include "tools/Complaint.h"
#include "tools/ServiceConfiguration.h"
#include "tools/TextTable.h"
#include "tools/status/StatusSource.h"
#include "tools/status/StatusText.h"

namespace halvox::tools {

ExitStatus showStatus(const ShowStatus& /*request*/, const CommonOptions& options,
                      const ToolStreams& streams) {
  const Complaint complain("status", options.form(), streams.output, streams.errors);
  const auto configuration = serviceConfiguration(complain);
  if (const auto* failed = std::get_if<ExitStatus>(&configuration)) return *failed;
  const auto socket = namedSocket(options, complain);
  if (const auto* failed = std::get_if<ExitStatus>(&socket)) return *failed;
  const ServiceStatus status = readStatus(std::get<platform::linux_::Configuration>(configuration),
                                          std::get<std::string>(socket), options.timeout);
  if (options.json) {
    streams.output << statusJson(status) << '\n';
  } else {
    streams.output << statusText(status, terminalWidth(streams.outputDescriptor));
  }
  return status.service.isConnected ? ExitStatus::kDone : ExitStatus::kNoService;
}

}  // namespace halvox::tools
