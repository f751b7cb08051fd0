#include "tools/Verify.h"

#include <filesystem>
#include <string>
#include <variant>

#include "platform/linux/store/reading/verify/StoreVerifier.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/ServiceConfiguration.h"
#include "tools/StoreRun.h"
#include "tools/Summary.h"
#include "tools/VerifyFiles.h"

namespace halvox::tools {
namespace {

namespace fs = std::filesystem;
using platform::linux_::Differences;
using platform::linux_::StoreDifference;
using platform::linux_::StoreVerifier;

std::string differenceText(const StoreDifference& difference, OutputForm form) {
  if (form == OutputForm::kText) {
    return harmlessText(difference.place) + ": " + harmlessText(difference.what);
  }
  return "{\"place\":" + harmlessJson(tools::quoted(difference.place)) +
         ",\"difference\":" + harmlessJson(tools::quoted(difference.what)) + "}";
}

// What was read, for the end of the output.
struct Totals {
  std::uint64_t records = 0;
  std::uint64_t captures = 0;
  std::uint64_t summaries = 0;
  std::uint64_t differences = 0;
};

std::string totalsText(const Totals& totals, OutputForm form) {
  if (form == OutputForm::kJson) {
    return "{\"records\":" + std::to_string(totals.records) +
           ",\"captures\":" + std::to_string(totals.captures) +
           ",\"summaries\":" + std::to_string(totals.summaries) +
           ",\"differences\":" + std::to_string(totals.differences) + "}";
  }
  const std::string found = totals.differences == 0
                                ? "no differences"
                                : std::to_string(totals.differences) + " differences";
  return "verified " + std::to_string(totals.records) + " records, " +
         std::to_string(totals.captures) + " captures and " + std::to_string(totals.summaries) +
         " summary files: " + found;
}

// Returns the directory below which the service of that store writes its summary files.
std::variant<fs::path, ExitStatus> rootOf(const VerifyStore& request, const fs::path& directory,
                                          const Complaint& complain) {
  if (!request.database.empty()) return directory / "root";
  const auto configuration = serviceConfiguration(complain);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  return std::get<platform::linux_::Configuration>(configuration).storage.root;
}

}  // namespace

ExitStatus verifyStore(const VerifyStore& request, const CommonOptions& options,
                       const ToolStreams& streams) {
  const Complaint complain("verify", options.form(), streams.output, streams.errors);
  const auto found = storeDirectory(request.database, complain);
  if (const auto* status = std::get_if<ExitStatus>(&found)) return *status;
  const auto& directory = std::get<fs::path>(found);
  const auto root = rootOf(request, directory, complain);
  if (const auto* status = std::get_if<ExitStatus>(&root)) return *status;

  Differences differences([&](const StoreDifference& difference) {
    streams.output << differenceText(difference, options.form()) << '\n';
  });
  StoreVerifier verifier(differences);
  const auto store = verifier.verify(directory);
  if (!store) return complain(ExitStatus::kNoService, store.error().message, "no-store");
  const Totals totals{
      .records = store->records,
      .captures = verifyCaptures(store->captures, directory / "snapshots", differences),
      .summaries = verifySummaries(std::get<fs::path>(root) / kSummaryDirectory, differences),
      .differences = differences.total()};
  streams.output << totalsText(totals, options.form()) << '\n';
  return totals.differences == 0 ? ExitStatus::kDone : ExitStatus::kRefused;
}

}  // namespace halvox::tools
