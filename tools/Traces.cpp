#include "tools/Traces.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <system_error>
#include <thread>
#include <utility>
#include <variant>

#include <sys/stat.h>
#include <unistd.h>

#include "client/HalvoxClient.h"
#include "client/Vocabulary.h"
#include "platform/linux/base/ChildProcess.h"
#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/tracing/PlistPropertyListService.h"
#include "tools/JsonText.h"
#include "tools/ServiceConfiguration.h"
#include "tools/TextTable.h"
#include "tools/TraceResults.h"
#include "tracing/TraceParamsParser.h"

namespace halvox::tools {
namespace {

namespace fs = std::filesystem;

constexpr client::ServiceType kTestService = 11;
// The range of codes that the service records.
constexpr std::uint32_t kFirstCode = 0x21040000;
constexpr std::uint32_t kLastCode = 0x2104408A;
// The service answers the stop only after it has read the trace back, which can take minutes.
constexpr std::chrono::minutes kStopWithin{10};
// The service ends a tracer that does not answer within ten seconds. Wait longer than that.
constexpr std::chrono::seconds kRecordsWithin{15};
// The pause between two looks into the directory of recordings. It is polled, because nothing
// announces that a recording has begun.
constexpr std::chrono::milliseconds kLookEvery{5};

using platform::Dictionary;

std::string microseconds(double nanoseconds) {
  std::array<char, 64> text{};
  std::snprintf(text.data(), text.size(), "%.3f", nanoseconds / 1000);
  return text.data();
}

void printTable(const TraceResults& results, std::ostream& out) {
  constexpr auto kRight = TextTable::Align::kRight;
  TextTable table({{.heading = "NAME"},
                   {.heading = "COUNT", .align = kRight},
                   {.heading = "MIN us", .align = kRight},
                   {.heading = "MEDIAN us", .align = kRight},
                   {.heading = "P95 us", .align = kRight},
                   {.heading = "MAX us", .align = kRight}});
  for (const auto& [name, values] : results.values) {
    if (values.empty()) continue;
    const TraceStatistics found = statisticsOf(values);
    table.add({harmlessText(name), std::to_string(found.count), microseconds(found.minimum),
               microseconds(found.median), microseconds(found.percentile95),
               microseconds(found.maximum)});
  }
  table.print(out, std::nullopt);
}

void printJson(const TraceResults& results, std::ostream& out) {
  for (const auto& [name, values] : results.values) {
    if (values.empty()) continue;
    const TraceStatistics found = statisticsOf(values);
    out << toJson(Dictionary{{"name", name},
                             {"count", static_cast<std::uint64_t>(found.count)},
                             {"min_ns", found.minimum},
                             {"median_ns", found.median},
                             {"p95_ns", found.percentile95},
                             {"max_ns", found.maximum}})
        << '\n';
  }
}

// The result of reading a trace parameters file.
struct ParamsFindings {
  std::size_t intervals = 0;           // that can be measured
  std::vector<std::string> reasons{};  // why others are not: what the service logs, and more
};

class ParamsListener final : public TraceParamsParser::Listener {
 public:
  explicit ParamsListener(std::vector<std::string>& reasons) : reasons_(reasons) {}
  void onError(const std::string& sentence) override { reasons_.push_back(sentence); }
  void onTracePoint(const TraceDataParams& /*point*/) override {}

 private:
  std::vector<std::string>& reasons_;
};

bool isRecorded(std::uint32_t code) { return code >= kFirstCode && code <= kLastCode; }

std::string hexadecimal(std::uint32_t code) {
  std::array<char, 16> text{};
  std::snprintf(text.data(), text.size(), "0x%08x", code);
  return text.data();
}

// Reads the file in the same way as the service.
ParamsFindings checkParams(const std::string& file) {
  ParamsFindings found;
  ParamsListener listener(found.reasons);
  const platform::linux_::PlistPropertyListService lists;
  const TraceParams params = TraceParamsParser(file).loadTraceParams(lists, listener);
  // The service answers such a session like any other and leaves an empty result.
  if (params.type == TraceType::kSignpost) {
    found.reasons.emplace_back("its TraceType is OSSignpost, which the service does not record");
    return found;
  }
  for (const TraceDataParams& point : params.tracePoints) {
    if (point.kind != TracePointKind::kInterval) continue;
    if (isRecorded(point.beginCode) && isRecorded(point.endCode)) {
      ++found.intervals;
    } else {
      found.reasons.push_back("the interval " + point.name + " goes from " +
                              hexadecimal(point.beginCode) + " to " + hexadecimal(point.endCode) +
                              ", but only codes from " + hexadecimal(kFirstCode) + " to " +
                              hexadecimal(kLastCode) + " are recorded");
    }
  }
  if (found.intervals == 0) found.reasons.emplace_back("it has no interval that can be measured");
  return found;
}

// Identifies a file and its last change; a replaced file has another identity.
std::pair<ino_t, std::int64_t> identityOf(const fs::path& file) {
  struct stat status {};
  if (::stat(file.c_str(), &status) != 0) return {};
  return {status.st_ino, status.st_mtim.tv_sec * 1'000'000'000 + status.st_mtim.tv_nsec};
}

using Names = std::set<std::string>;

// Returns the running recordings of the service; none if this user may not see them.
std::optional<Names> recordings(const fs::path& storage) {
  Names names;
  std::error_code error;
  for (const auto& entry : fs::directory_iterator(storage / "traces/recording", error)) {
    names.insert(entry.path().filename());
  }
  if (error && error != std::errc::no_such_file_or_directory) return std::nullopt;
  return names;
}

// Waits for a recording that was not there before, because the service answers the start before the
// tracer is ready. Returns false if none begins.
bool recordsSoon(const fs::path& storage, const Names& before) {
  const auto deadline = std::chrono::steady_clock::now() + kRecordsWithin;
  while (std::chrono::steady_clock::now() < deadline) {
    const auto now = recordings(storage);
    // A user who may not see the recordings cannot wait for one. The program then runs at once.
    if (!now.has_value() || !std::ranges::includes(before, *now)) return true;
    std::this_thread::sleep_for(kLookEvery);
  }
  return false;
}

// A session that the service traces from its start to its stop.
class TracedSession {
 public:
  explicit TracedSession(std::unique_ptr<client::HalvoxConnection> connection)
      : connection_(std::move(connection)) {}

  // Returns why the session does not run; empty if it runs.
  std::string start(const std::string& params) {
    const Dictionary configuration{{"HVReportingTraceType", "ktrace"},
                                   {"HVReportingMeridelPlistFilePath", params}};
    const auto failed = [](const auto& result) {
      return result ? std::string() : result.failure->message;
    };
    std::string failure = failed(connection_->createReportingSession(id_));
    if (failure.empty()) failure = failed(connection_->setServiceType(kTestService, id_));
    if (failure.empty()) failure = failed(connection_->setConfiguration(configuration, id_));
    if (failure.empty()) failure = failed(connection_->startReportingSessionForID(id_));
    return failure;
  }

  // Returns after the service has written the results: an empty text, or why they may be missing.
  std::string stop() {
    const auto stopped = connection_->stopReportingSessionForID(id_);
    if (!stopped) return stopped.failure->message;
    const auto destroyed = connection_->destroyReportingSession(id_);
    return destroyed ? std::string() : destroyed.failure->message;
  }

 private:
  // Each client has IDs of its own, and this client has no other session.
  const client::ReporterID id_ = ::getpid();
  const std::unique_ptr<client::HalvoxConnection> connection_;
};

void print(const TraceResults& results, OutputForm form, std::ostream& out) {
  form == OutputForm::kJson ? printJson(results, out) : printTable(results, out);
}

// Prints what was measured with these parameters, or reports that nothing was.
ExitStatus showMeasured(const std::string& file, const std::string& params, OutputForm form,
                        std::ostream& out, const Complaint& complain) {
  const auto results = readTraceResults(file);
  if (!results) return complain(ExitStatus::kBadArguments, results.error().message);
  const auto isEmpty = [](const auto& entry) { return entry.second.empty(); };
  if (std::ranges::all_of(results->values, isEmpty)) {
    return complain(ExitStatus::kRefused,
                    "nothing was measured: either no program emitted both codes of an interval, or "
                    "the service could not record or could not read " +
                        params + "; the service's log says which");
  }
  print(*results, form, out);
  return ExitStatus::kDone;
}

// Returns why the program's run counts as failed; empty if it does not.
std::string runProgram(const std::vector<std::string>& command) {
  using namespace platform::linux_;
  // The program inherits the signal settings of our caller, such as those that nohup ignores.
  auto child =
      ChildProcess::start({.command = command, .signals = ChildProgram::Signals::kInherited});
  if (!child) return "cannot run " + command[0] + ": " + errnoText(child.error().code);
  const ChildEnd end = child->wait();
  if (end.isSuccess()) return {};
  return command[0] + (end.signal != 0 ? " was " : " ") + end.text();
}

}  // namespace

ExitStatus recordTrace(const RecordTrace& request, const CommonOptions& options, std::ostream& out,
                       std::ostream& errors) {
  const Complaint complain("trace record", options.form(), out, errors);
  const auto loaded = serviceConfiguration(complain);
  if (const auto* status = std::get_if<ExitStatus>(&loaded)) return *status;
  const auto& configuration = std::get<platform::linux_::Configuration>(loaded);
  const fs::path results = traceResultsFile(configuration.storage.root);
  // The service has another working directory.
  const std::string params = fs::absolute(request.params).string();
  // The service reports mistakes in this file only in its own log. Reading it here shows them to
  // the user, before the program runs.
  const ParamsFindings found = checkParams(params);
  const bool isUsable = found.intervals > 0;
  for (const std::string& reason : found.reasons) {
    std::string text = params;
    text.append(": ").append(reason);
    isUsable ? complain.warn(text) : static_cast<void>(complain(ExitStatus::kBadArguments, text));
  }
  if (!isUsable) return ExitStatus::kBadArguments;
  // Taken before the session exists, because results that an earlier trace left must not be shown
  // as new.
  const auto before = identityOf(results);
  const auto socket = namedSocket(options, complain);
  if (const auto* status = std::get_if<ExitStatus>(&socket)) return *status;
  auto opened = client::HalvoxConnection::open(
      std::get<std::string>(socket),
      // This is longer than --timeout, because the answer to the stop waits for the evaluation of
      // the trace.
      std::max<std::chrono::milliseconds>(options.timeout, kStopWithin));
  if (!opened) return complain(ExitStatus::kNoService, opened.failure->message);
  const fs::path& storage = configuration.storage.directory;
  const Names earlier = recordings(storage).value_or(Names());
  TracedSession session(std::move(*opened.value));
  if (const std::string failure = session.start(params); !failure.empty()) {
    return complain(ExitStatus::kRefused, failure);
  }
  if (isTracingOn(configuration) && !recordsSoon(storage, earlier)) {
    return complain(ExitStatus::kRefused,
                    "the service does not record; see its log for the reason");
  }
  // The session is stopped even if the program fails, so that its trace ends and is shown.
  const std::string ofProgram = runProgram(request.command);
  if (const std::string failure = session.stop(); !failure.empty()) {
    return complain(ExitStatus::kRefused, failure);
  }
  if (!ofProgram.empty()) complain(ExitStatus::kRefused, ofProgram);
  if (identityOf(results) == before) {
    return complain(ExitStatus::kRefused,
                    "the service wrote no new results to " + results.string() +
                        "; it traces only if Tracing is on in [features.Acoustat]");
  }
  const ExitStatus shown = showMeasured(results.string(), params, options.form(), out, complain);
  return ofProgram.empty() ? shown : ExitStatus::kRefused;
}

ExitStatus showTrace(const ShowTrace& request, OutputForm form, std::ostream& out,
                     std::ostream& errors) {
  const Complaint complain("trace show", form, out, errors);
  const auto read = readTraceResults(request.file);
  if (!read) return complain(ExitStatus::kBadArguments, read.error().message);
  print(*read, form, out);
  return ExitStatus::kDone;
}

ExitStatus exportTrace(const ExportTrace& request, OutputForm form, std::ostream& out,
                       std::ostream& errors) {
  const Complaint complain("trace export", form, out, errors);
  const auto read = readTraceResults(request.file);
  if (!read) return complain(ExitStatus::kBadArguments, read.error().message);
  std::ofstream file(request.to);
  if (file) writeTraceEvents(*read, file);
  file.close();
  if (file) return ExitStatus::kDone;
  return complain(ExitStatus::kCannotWrite, request.to + ": " + platform::linux_::errnoText(errno));
}

}  // namespace halvox::tools
