#include "tools/Fields.h"

#include <algorithm>
#include <array>
#include <filesystem>
#include <string_view>
#include <utility>
#include <variant>

#include "analysis/FieldCollector.h"
#include "analysis/StoreRecordSource.h"

#include "client/Vocabulary.h"
#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Complaint.h"
#include "tools/Globs.h"
#include "tools/JsonText.h"
#include "tools/StoreRun.h"
#include "tools/TextTable.h"

namespace halvox::tools {
namespace {

using analysis::Field;
using analysis::FieldCollector;
using analysis::FieldPlace;
using analysis::FieldType;
using analysis::Record;
using analysis::RecordKind;

constexpr client::Category kCategoryProper = 0xFFFF;
// An example is there to recognise a value by. JSON output has more of it.
constexpr std::size_t kExampleWidth = 60;

bool hasCategory(const Record& record, const std::vector<std::uint32_t>& categories) {
  return categories.empty() || std::ranges::any_of(categories, [&](std::uint32_t wanted) {
           const std::string name = client::categoryName(wanted);
           if (record.category == name) return true;
           return (wanted & ~kCategoryProper) == 0 && record.category.ends_with("_" + name);
         });
}

bool hasType(const Record& record, const std::vector<std::uint16_t>& types) {
  return types.empty() || std::ranges::any_of(types, [&](std::uint16_t wanted) {
           return record.type == client::eventTypeName(wanted);
         });
}

bool hasApplication(const Record& record, const std::vector<std::string>& patterns) {
  if (patterns.empty()) return true;
  return record.kind == RecordKind::kEvent &&
         matchesAnyGlob(patterns, std::string(record.application));
}

bool isSelected(const ShowFields& request, const Record& record) {
  return hasType(record, request.types) && hasCategory(record, request.categories) &&
         hasApplication(record, request.applications);
}

ExitStatus collect(const ShowFields& request, const Complaint& complain,
                   FieldCollector& collector) {
  const auto directory = storeDirectory(request.database, complain);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  platform::linux_::StoreReader reader;
  const auto opened = reader.open(std::get<std::filesystem::path>(directory));
  if (!opened) return complain(ExitStatus::kNoService, opened.error().message, "no-store");
  analysis::StoreRecordSource source(reader);
  const auto read = source.forEach(
      {.since = request.since, .until = request.until, .power = true, .snapshots = true},
      [&](const Record& record) {
        if (isSelected(request, record)) collector.add(record);
      });
  if (!read) return complain(ExitStatus::kNoService, read.error().message, "no-store");
  return ExitStatus::kDone;
}

// The types with their counts, the most frequent first.
std::vector<std::pair<std::string_view, std::uint64_t>> typesOf(const Field& field) {
  std::vector<std::pair<std::string_view, std::uint64_t>> types;
  for (std::size_t type = 0; type < field.types.size(); ++type) {
    if (field.types[type] == 0) continue;
    types.emplace_back(analysis::fieldTypeName(static_cast<FieldType>(type)), field.types[type]);
  }
  std::ranges::stable_sort(
      types, [](const auto& left, const auto& right) { return left.second > right.second; });
  return types;
}

std::vector<std::string> rowOf(const Field& field) {
  std::string types;
  for (const auto& [name, count] : typesOf(field)) {
    types.append(types.empty() ? "" : ", ").append(name);
  }
  std::string places;
  for (const FieldPlace& place : field.places) {
    places += (places.empty() ? "" : ", ") + harmlessText(place.name);
  }
  if (field.otherPlaces > 0) places += ", others";
  std::string example = harmlessText(field.example);
  if (field.isExampleCut) example += "…";
  return {harmlessText(field.key), types, std::to_string(field.records()),
          cutTo(example, kExampleWidth), places};
}

std::string exampleJson(const Field& field) {
  // The beginning of an array or a dictionary is not JSON.
  const bool isText = field.exampleType == FieldType::kText || field.isExampleCut;
  return harmlessJson(isText ? tools::quoted(field.example) : field.example);
}

std::string jsonOf(const Field& field) {
  std::string json = "{\"key\":" + harmlessJson(tools::quoted(field.key)) + ",\"types\":{";
  std::string_view comma;
  for (const auto& [name, count] : typesOf(field)) {
    json.append(std::exchange(comma, ",")).append(tools::quoted(name)).append(":");
    json += std::to_string(count);
  }
  json += "},\"records\":" + std::to_string(field.records()) +
          ",\"events\":" + std::to_string(field.events) +
          ",\"link_messages\":" + std::to_string(field.linkMessages) +
          ",\"power_events\":" + std::to_string(field.powerEvents) +
          ",\"snapshots\":" + std::to_string(field.snapshots) +
          ",\"first\":" + toJson(field.first) + ",\"last\":" + toJson(field.last) +
          ",\"example\":" + exampleJson(field) +
          ",\"example_is_cut\":" + (field.isExampleCut ? "true" : "false") + ",\"in\":[";
  comma = {};
  for (const FieldPlace& place : field.places) {
    json.append(std::exchange(comma, ",")).append("{\"name\":");
    json +=
        harmlessJson(tools::quoted(place.name)) + ",\"count\":" + std::to_string(place.count) + "}";
  }
  return json + "],\"in_others\":" + std::to_string(field.otherPlaces) + "}";
}

void warnOfLimits(const FieldCollector& collector, const Complaint& complain) {
  if (const auto values = collector.valuesOfOtherKeys(); values > 0) {
    complain.warn("not shown: " + std::to_string(values) + " values under further keys; only the " +
                  "first " + std::to_string(FieldCollector::kMostKeys) +
                  " keys are shown. Select fewer records to see the others");
  }
  if (const auto values = collector.valuesOfLongKeys(); values > 0) {
    complain.warn("not shown: " + std::to_string(values) + " values under keys of more than " +
                  std::to_string(FieldCollector::kMostKeyBytes) + " bytes");
  }
}

}  // namespace

ExitStatus showFields(const ShowFields& request, OutputForm form, std::ostream& out,
                      int outputDescriptor, std::ostream& errors) {
  const Complaint complain("fields", form, out, errors);
  FieldCollector collector;
  const ExitStatus status = collect(request, complain, collector);
  if (status != ExitStatus::kDone) return status;
  const std::vector<Field> fields = collector.take();
  if (form == OutputForm::kJson) {
    for (const Field& field : fields) out << jsonOf(field) << '\n';
  } else {
    TextTable table({{.heading = "KEY", .least = 16},
                     {.heading = "TYPE", .least = 7},
                     {.heading = "RECORDS", .align = TextTable::Align::kRight},
                     {.heading = "EXAMPLE", .least = 12, .rank = 1},
                     {.heading = "IN", .least = 16, .rank = 2}});
    for (const Field& field : fields) table.add(rowOf(field));
    table.print(out, terminalWidth(outputDescriptor));
  }
  out << std::flush;
  warnOfLimits(collector, complain);
  return ExitStatus::kDone;
}

}  // namespace halvox::tools
