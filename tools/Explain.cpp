#include "tools/Explain.h"

#include <filesystem>
#include <utility>
#include <variant>

#include "client/HalvoxClient.h"
#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Complaint.h"
#include "tools/Explainer.h"
#include "tools/Explanation.h"
#include "tools/ServiceConfiguration.h"
#include "tools/StoreRun.h"
#include "tools/TextTable.h"

namespace halvox::tools {
namespace {

namespace store = platform::linux_;

// Asks a running service whether it has the session. Returns a sentence without its article and
// full stop; empty if there is no answer.
std::string askService(std::int64_t id, const CommonOptions& options, const Complaint& complain) {
  const auto socket = namedSocket(options, complain);
  if (!std::holds_alternative<std::string>(socket)) return {};
  const auto opened =
      client::HalvoxConnection::open(std::get<std::string>(socket), options.timeout);
  if (!opened) return {};
  const auto answer = (*opened.value)->reporterIDValid(id);
  if (!answer) return {};
  const platform::Value* found = answer.value->find("reporterID");
  if (found == nullptr || found->toInt64() != id || id == 0) {
    return "running service has no session " + std::to_string(id) + " now";
  }
  return "running service has session " + std::to_string(id) + " now";
}

}  // namespace

ExitStatus explain(const Explain& request, const CommonOptions& options,
                   const ToolStreams& streams) {
  const Complaint complain("explain", options.form(), streams.output, streams.errors);
  auto configuration = serviceConfiguration(complain);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  const auto directory = storeDirectory(request.database, complain);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  const auto& path = std::get<std::filesystem::path>(directory);
  store::StoreReader reader;
  const auto opened = reader.open(path);
  if (!opened) return complain(ExitStatus::kNoService, opened.error().message, "no-store");

  ExplainSettings settings{
      .configuration = std::get<store::Configuration>(std::move(configuration)),
      .server = store::storeServer(path)};
  const bool isServed = settings.server.use == store::StoreUse::kServed;
  Explainer explainer(request, complain, reader, std::move(settings));
  auto outcome = explainer.run([&](std::int64_t id) {
    return isServed ? askService(id, options, complain) : std::string();
  });
  if (const auto* status = std::get_if<ExitStatus>(&outcome)) return *status;
  bool isFirst = true;
  for (const Explanation& explanation : std::get<std::vector<Explanation>>(outcome)) {
    if (options.json) {
      streams.output << explanationJson(explanation) << '\n';
    } else {
      if (!std::exchange(isFirst, false)) streams.output << '\n';
      printExplanation(explanation, streams.output, terminalWidth(streams.outputDescriptor));
    }
  }
  streams.output << std::flush;
  return ExitStatus::kDone;
}

}  // namespace halvox::tools
