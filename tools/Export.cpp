#include "tools/Export.h"

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <system_error>
#include <utility>
#include <variant>

#include "platform/linux/runtime/Version.h"
#include "platform/linux/store/reading/StoreExport.h"
#include "platform/value.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/StoreRun.h"
#include "tools/export/ApplicationFilter.h"
#include "tools/export/CsvWriter.h"
#include "tools/export/ExportOutput.h"
#include "tools/export/ExportProgress.h"
#include "tools/export/JsonlWriter.h"
#include "tools/export/OtlpWriter.h"

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

// Why an export ended early, and with which status.
struct ExportFailure {
  ExitStatus status;
  std::string message;
};

// One run of the command.
class Export {
 public:
  Export(const ExportRecords& request, StoreReader& reader, const ToolStreams& streams)
      : request_(request),
        reader_(reader),
        streams_(streams),
        progress_(streams.errors, streams.isErrorTerminal ? ExportProgress::Shown::kAtTerminal
                                                          : ExportProgress::Shown::kNever) {}

  std::optional<ExportFailure> run() {
    auto failure = request_.format == ExportFormat::kSqlite ? toDatabase() : toText();
    progress_.clear();
    return failure;
  }
  // What a person or a program is shown at the end.
  [[nodiscard]] Dictionary totals() const { return {{"file", request_.to}, {"records", records_}}; }
  [[nodiscard]] std::string summary() const { return std::to_string(records_) + " records"; }

 private:
  using Handler = std::function<Result<void>(const StoredItem&)>;

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
          if (!handled || !isWanted) return;
          handled = handle(item);
          ++records_;
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
  const ToolStreams& streams_;
  ExportProgress progress_;
  std::uint64_t records_ = 0;
};

// Returns why the file cannot be written; empty if it can, as far as that shows before the store
// was read.
std::string whyNot(const ExportRecords& request) {
  if (request.to == kStandardOutput) return {};
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
  if (const auto opened = reader.open(std::get<fs::path>(directory)); !opened) {
    return complain(ExitStatus::kNoService, opened.error().message, "no-store");
  }
  if (const std::string reason = whyNot(request); !reason.empty()) {
    return complain(ExitStatus::kBadArguments, reason);
  }
  Export run(request, reader, streams);
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
