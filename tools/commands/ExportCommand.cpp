#include <algorithm>
#include <array>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "tools/Export.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {
namespace {

using platform::linux_::Failure;
using platform::linux_::Result;

constexpr const char* kStandardOutput = "-";

constexpr std::array<std::pair<std::string_view, ExportFormat>, 5> kFormats{
    {{"sqlite", ExportFormat::kSqlite},
     {"jsonl", ExportFormat::kJsonl},
     {"csv", ExportFormat::kCsv},
     {"otlp-json", ExportFormat::kOtlpJson},
     {"perfetto", ExportFormat::kPerfetto}}};
constexpr std::array kKinds{ExportKind::kEvents, ExportKind::kMetrics,   ExportKind::kPower,
                            ExportKind::kLink,   ExportKind::kSnapshots, ExportKind::kLosses};

Result<ExportFormat> parseFormat(std::string_view text) {
  std::string names;
  for (const auto& [name, format] : kFormats) {
    if (text == name) return format;
    names.append(names.empty() ? "" : ", ").append(name);
  }
  return Failure<>{"\"" + std::string(text) + "\" is not a format; expected one of " + names};
}

Result<ExportKind> parseKind(std::string_view text) {
  std::string names;
  for (const ExportKind kind : kKinds) {
    if (text == wordOf(kind)) return kind;
    names.append(names.empty() ? "" : ", ").append(wordOf(kind));
  }
  return Failure<>{"\"" + std::string(text) + "\" is not a kind of records; expected one of " +
                   names};
}

std::vector<std::string> formatNames() {
  std::vector<std::string> names;
  names.reserve(std::size(kFormats));
  for (const auto& [name, format] : kFormats) names.emplace_back(name);
  return names;
}

std::vector<std::string> kindNames() {
  std::vector<std::string> names;
  names.reserve(std::size(kKinds));
  for (const ExportKind kind : kKinds) names.emplace_back(wordOf(kind));
  return names;
}

ExportKinds kindsOf(const std::vector<ExportKind>& asked) {
  if (asked.empty()) return {};
  const auto has = [&](ExportKind kind) {
    return std::find(asked.begin(), asked.end(), kind) != asked.end();
  };
  return {.events = has(ExportKind::kEvents),
          .metrics = has(ExportKind::kMetrics),
          .power = has(ExportKind::kPower),
          .link = has(ExportKind::kLink),
          .snapshots = has(ExportKind::kSnapshots),
          .losses = has(ExportKind::kLosses)};
}

ExportRecords checked(ExportRecords request, const std::vector<ExportKind>& kinds) {
  request.kinds = kindsOf(kinds);
  if (request.format == ExportFormat::kSqlite && request.to == kStandardOutput) {
    throw CLI::ValidationError("--output",
                               "--format sqlite needs a file, such as -o records.db; the other "
                               "formats can go to the standard output");
  }
  if (request.format == ExportFormat::kPerfetto && !kinds.empty()) {
    throw CLI::ValidationError("--kind",
                               "--format perfetto shows streams, not records of one kind; remove "
                               "--kind");
  }
  return request;
}

}  // namespace

void addExportCommand(CommandSet& commands) {
  const auto request = std::make_shared<ExportRecords>();
  const auto kinds = std::make_shared<std::vector<ExportKind>>();
  CLI::App& app = commands.add(
      {.name = "export",
       .summary = "Write the stored records in a form that other programs read",
       .example = "halvoxctl export --since today -o records.db\n"
                  "  halvoxctl export --format jsonl --app 'org.example.*' | jq .payload",
       .details = "A file gets its name when it is complete. docs/export.md describes the formats.",
       .reach = CommandReach::kFiles});
  offerWords(
      addParsed(
          app, "--format", request->format, parseFormat,
          "sqlite: a database with six plain tables (default); jsonl: one JSON object a line; "
          "csv: one table for spreadsheets; otlp-json: log records of OpenTelemetry, one request "
          "a line; perfetto: a trace of the streams for Perfetto's viewer")
          ->type_name("FORMAT"),
      formatNames());
  offerFiles(
      app.add_option("-o,--output,--to", request->to,
                     "The file to write; - is the standard output (default, except for sqlite)")
          ->type_name("FILE"),
      {"-"});
  app.add_flag("--force", request->replace, "Replace the file if it exists");
  offerWords(addEach(app, "--kind", *kinds, parseKind,
                     "Only records of this kind: events, metrics, power, link, snapshots or losses")
                 ->type_name("KIND"),
             kindNames());
  offerLive(
      app.add_option(
             "--app", request->applications,
             "Only records of applications that match this glob pattern; may be given several "
             "times")
          ->type_name("GLOB")
          ->expected(1)
          ->take_all(),
      "applications");
  addTimes(app, request->since, request->until, "records");
  addDatabase(app, request->database);
  commands.onRun(
      app, [request, kinds] { return checked(*request, *kinds); }, exportRecords);
}

}  // namespace halvox::tools
