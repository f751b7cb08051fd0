#include "tools/Export.h"

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <sstream>
#include <system_error>
#include <utility>
#include <variant>

#include "analysis/StoreRecordSource.h"
#include "analysis/StreamBuilder.h"
#include <unistd.h>

#include "platform/linux/runtime/Version.h"
#include "platform/linux/store/reading/StoreExport.h"
#include "platform/value.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/ServiceConfiguration.h"
#include "tools/StoreRun.h"
#include "tools/StreamFinish.h"
#include "tools/TraceResults.h"
#include "tools/export/ApplicationFilter.h"
#include "tools/export/CsvWriter.h"
#include "tools/export/ExportOutput.h"
#include "tools/export/ExportProgress.h"
#include "tools/export/JsonlWriter.h"
#include "tools/export/OtlpWriter.h"
#include "tools/export/PerfettoIntervals.h"
#include "tools/export/PerfettoLosses.h"
#include "tools/export/PerfettoStreams.h"
#include "tools/export/PerfettoTrace.h"

namespace halvox::tools {
namespace {

namespace fs = std::filesystem;
using platform::Dictionary;
using platform::linux_::Result;
using platform::linux_::StoredItem;
using platform::linux_::StoreExport;
using platform::linux_::StoreReader;

constexpr std::string_view kStandardOutput = "-";
// Enough that writing costs little beside reading.
constexpr std::size_t kBytesPerWrite = std::size_t{256} << 10U;

double now() {
  const auto time = std::chrono::system_clock::now().time_since_epoch();
  return std::chrono::duration<double>(time).count();
}

// Why an export ended early, and with which status.
struct ExportFailure {
  ExitStatus status;
  std::string message;
};

// One run of the command.
class Export {
 public:
  Export(const ExportRecords& request, StoreReader& reader, const fs::path& directory,
         const ToolStreams& streams)
      : request_(request),
        reader_(reader),
        directory_(directory),
        streams_(streams),
        progress_(streams.errors, streams.isErrorTerminal ? ExportProgress::Shown::kAtTerminal
                                                          : ExportProgress::Shown::kNever) {}

  std::optional<ExportFailure> run() {
    auto failure = write();
    progress_.clear();
    return failure;
  }
  // What a person or a program is shown at the end.
  [[nodiscard]] Dictionary totals() const {
    if (request_.format != ExportFormat::kPerfetto) {
      return {{"file", request_.to}, {"records", records_}};
    }
    return {{"file", request_.to},
            {"streams", streamCount_},
            {"xruns", xruns_},
            {"trace_intervals", intervals_}};
  }
  [[nodiscard]] std::string summary() const {
    if (request_.format != ExportFormat::kPerfetto) return std::to_string(records_) + " records";
    return std::to_string(streamCount_) + " streams, " + std::to_string(xruns_) + " xruns" +
           (intervals_ > 0 ? ", " + std::to_string(intervals_) + " trace intervals" : "");
  }

 private:
  using Handler = std::function<Result<void>(const StoredItem&)>;

  std::optional<ExportFailure> write() {
    switch (request_.format) {
      case ExportFormat::kSqlite:
        return toDatabase();
      case ExportFormat::kJsonl:
      case ExportFormat::kCsv:
      case ExportFormat::kOtlpJson:
        return toText();
      case ExportFormat::kPerfetto:
        return toTrace();
    }
    return std::nullopt;
  }

  std::optional<ExportFailure> toDatabase() {
    StoreExport file(request_.to);
    if (auto created = file.create(); !created) return cannotWrite(created);
    auto failure = forEachRecord([&](const StoredItem& item) { return file.add(item); });
    if (failure) return failure;
    return cannotWrite(file.finish());
  }

  std::optional<ExportFailure> toText() {
    const auto output = makeOutput();
    const auto writer = makeWriter();
    std::string text;
    const auto write = [&](std::size_t atLeast) -> Result<void> {
      if (text.size() < atLeast) return {};
      auto written = output->write(text);
      text.clear();
      return written;
    };
    writer->begin(text);
    auto failure = forEachRecord([&](const StoredItem& item) {
      writer->add(item, text);
      return write(kBytesPerWrite);
    });
    if (failure) return failure;
    writer->finish(text);
    auto written = write(1);
    if (written) written = output->finish();
    return cannotWrite(written);
  }

  std::optional<ExportFailure> toTrace() {
    const auto output = makeOutput();
    std::string text;
    PerfettoTrace trace(text);
    PerfettoStreams shown(trace, {.applications = request_.applications, .since = request_.since});
    analysis::StreamBuilder builder(
        [&](const analysis::StreamStory& story) { shown.onStory(story); },
        [&](const analysis::StreamStory& story, const analysis::StreamMoment& moment) {
          shown.onMoment(story, moment);
        });
    PerfettoLosses losses(trace);
    trace.begin(PerfettoTrace::timeOf(request_.since.value_or(now())));
    Result<void> written;
    analysis::StoreRecordSource source(reader_);
    // All messages: a stream that ran in the time that was asked for may have begun long before it.
    const auto onRecord = [&](const analysis::Record& record) {
      progress_.onRecord(record.time);
      builder.add(record);
      if (isWantedLoss(record)) losses.add(record);
      if (text.size() < kBytesPerWrite) return;
      written = output->write(text);
      text.clear();
      if (!written) reader_.stopReading();
    };
    const auto read =
        source.forEach({.since = std::nullopt, .until = request_.until, .losses = true}, onRecord);
    if (!written) return cannotWrite(written);
    if (!read) return ExportFailure{ExitStatus::kNoService, read.error().message};
    // What came after the period is not known.
    builder.finish(request_.until && *request_.until < now()
                       ? analysis::StreamBuilder::Finish{.now = request_.until}
                       : streamFinish(directory_));
    intervals_ = addNewestIntervals(trace);
    streamCount_ = shown.streams();
    xruns_ = shown.xruns();
    written = output->write(text);
    if (written) written = output->finish();
    return cannotWrite(written);
  }

  // Losses belong to no application.
  [[nodiscard]] bool isWantedLoss(const analysis::Record& record) const {
    return request_.applications.empty() && (!request_.since || record.time >= *request_.since);
  }

  // Adds the newest results of a trace, if they are of the time that was asked for. They belong to
  // no application, and another store need not be that of the service whose configuration is read.
  std::uint64_t addNewestIntervals(PerfettoTrace& trace) const {
    if (!request_.database.empty() || !request_.applications.empty()) return 0;
    std::ostringstream ignored;
    const auto configuration =
        serviceConfiguration(Complaint("export", OutputForm::kText, ignored, ignored));
    if (std::holds_alternative<ExitStatus>(configuration)) return 0;
    const fs::path file =
        traceResultsFile(std::get<platform::linux_::Configuration>(configuration).storage.root);
    std::error_code failed;
    const auto written = std::chrono::file_clock::to_sys(fs::last_write_time(file, failed));
    const double time = std::chrono::duration<double>(written.time_since_epoch()).count();
    if (failed || (request_.since && time < *request_.since) ||
        (request_.until && time >= *request_.until)) {
      return 0;
    }
    const auto results = readTraceResults(file.native());
    return results ? addIntervals(trace, *results, PerfettoTrace::timeOf(time)) : 0;
  }

  // Calls `handle` for each record that was asked for, until it fails.
  std::optional<ExportFailure> forEachRecord(const Handler& handle) {
    ApplicationFilter applications(request_.applications);
    Result<void> handled;
    const auto read = reader_.forEachItem(
        storedKinds(request_.kinds), {.since = request_.since, .until = request_.until},
        [&](const StoredItem& item) {
          progress_.onRecord(item.time);
          // Every record: link messages are known by the events before them.
          const bool isWanted = applications.accepts(item) && request_.kinds.has(kindOf(item));
          if (!isWanted) return;
          handled = handle(item);
          ++records_;
          if (!handled) reader_.stopReading();
        });
    if (!handled) return cannotWrite(handled);
    if (!read) return ExportFailure{ExitStatus::kNoService, read.error().message};
    return std::nullopt;
  }

  [[nodiscard]] std::unique_ptr<RecordWriter> makeWriter() const {
    if (request_.format == ExportFormat::kCsv) return makeCsvWriter();
    return request_.format == ExportFormat::kJsonl
               ? makeJsonlWriter()
               : makeOtlpWriter(platform::linux_::halvoxVersion());
  }

  [[nodiscard]] std::unique_ptr<ExportOutput> makeOutput() const {
    if (request_.to == kStandardOutput) return makeStreamOutput(streams_.output);
    return makeFileOutput(
        request_.to, request_.replace ? NewFile::Existing::kReplaced : NewFile::Existing::kAnError);
  }

  static std::optional<ExportFailure> cannotWrite(const Result<void>& written) {
    if (written) return std::nullopt;
    return ExportFailure{ExitStatus::kCannotWrite, written.error().message};
  }

  const ExportRecords& request_;
  StoreReader& reader_;
  const fs::path& directory_;  // of the store
  const ToolStreams& streams_;
  ExportProgress progress_;
  std::uint64_t records_ = 0;
  std::uint64_t streamCount_ = 0;
  std::uint64_t xruns_ = 0;
  std::uint64_t intervals_ = 0;
};

// Returns why the file cannot be written; empty if it can, as far as that shows before the store
// was read.
std::string whyNot(const ExportRecords& request, const ToolStreams& streams) {
  if (request.to == kStandardOutput) {
    const bool isBinary = request.format == ExportFormat::kPerfetto;
    return isBinary && ::isatty(streams.outputDescriptor) != 0
               ? "a trace is not text, and the standard output is a terminal; name a file with -o"
               : std::string();
  }
  std::error_code ignored;
  const fs::file_status status = fs::status(request.to, ignored);
  if (!fs::exists(status)) return {};
  if (fs::is_directory(status)) return request.to + " is a directory; expected a file to write";
  if (!fs::is_regular_file(status)) {
    return request.format == ExportFormat::kSqlite
               ? request.to + " is not a file; expected one, which SQLite can open"
               : std::string();
  }
  return request.replace ? std::string() : request.to + " exists; --force replaces it";
}

}  // namespace

ExitStatus exportRecords(const ExportRecords& request, const CommonOptions& options,
                         const ToolStreams& streams) {
  const Complaint complain("export", options.form(), streams.output, streams.errors);
  const auto directory = storeDirectory(request.database, complain);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  StoreReader reader;
  const auto& path = std::get<fs::path>(directory);
  if (const auto opened = reader.open(path); !opened) {
    return complain(ExitStatus::kNoService, opened.error().message, "no-store");
  }
  if (const std::string reason = whyNot(request, streams); !reason.empty()) {
    return complain(ExitStatus::kBadArguments, reason);
  }
  Export run(request, reader, path, streams);
  if (const auto failure = run.run()) {
    return complain(failure->status, failure->message,
                    failure->status == ExitStatus::kNoService ? "no-store" : "");
  }
  // The standard output has the records alone.
  if (request.to == kStandardOutput) return ExitStatus::kDone;
  if (options.form() == OutputForm::kJson) {
    streams.output << toJson(run.totals()) << '\n';
  } else {
    streams.output << harmlessText(request.to) << ": " << run.summary() << '\n';
  }
  return ExitStatus::kDone;
}

}  // namespace halvox::tools
