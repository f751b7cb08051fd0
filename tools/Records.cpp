#include "tools/Records.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdio>
#include <optional>
#include <span>
#include <string_view>
#include <variant>

#include "platform/linux/base/Hexadecimal.h"
#include "platform/protobuf.h"
#include "tools/JsonText.h"
#include "tools/LinkNames.h"
#include "tools/StoreRun.h"

namespace halvox::tools {
namespace {

using platform::ProtoReader;
using platform::linux_::EventFollower;
using platform::linux_::hexadecimal;
using platform::linux_::RecordFilter;
using platform::linux_::RecordTable;
using platform::linux_::StoredRecord;
using platform::linux_::StoreReader;
namespace store = platform::linux_;

constexpr std::int64_t kAudioIssueDetected = 0x5B0003;

const RecordTable& tableOf(ShowRecords::Kind kind) {
  switch (kind) {
    case ShowRecords::Kind::kMetrics:
      return store::kIssueMetrics;
    case ShowRecords::Kind::kPower:
      return store::kPowerEvents;
    case ShowRecords::Kind::kLink:
      return store::kLinkMessages;
    case ShowRecords::Kind::kSnapshots:
      return store::kSnapshots;
  }
  return store::kLinkMessages;
}

const char* commandOf(ShowRecords::Kind kind) {
  switch (kind) {
    case ShowRecords::Kind::kMetrics:
      return "metrics";
    case ShowRecords::Kind::kPower:
      return "power";
    case ShowRecords::Kind::kLink:
      return "link";
    case ShowRecords::Kind::kSnapshots:
      return "snapshots";
  }
  return "";
}

// The field numbers of the metric's message.
enum AudioIssueField : std::uint8_t { kTimestamp = 1, kDuration, kIssueType, kNode, kRtaidClient };

// Returns the fields of the metric as a JSON object; nothing if the bytes are not such a message.
// In strings, bytes that are not UTF-8 are replaced.
std::optional<std::string> audioIssueAsJson(const std::string& bytes) {
  ProtoReader reader(std::as_bytes(std::span(bytes)));
  std::optional<std::uint64_t> timestamp;
  std::int32_t duration = 0;
  std::array<std::string, 3> texts;
  while (reader.hasMore()) {
    const ProtoReader::Tag tag = reader.readTag();
    if (reader.hasError()) break;
    if (tag.number == kTimestamp) {
      timestamp = reader.readVarint();
    } else if (tag.number == kDuration) {
      duration = static_cast<std::int32_t>(reader.readVarint());
    } else if (tag.number >= kIssueType && tag.number <= kRtaidClient) {
      reader.readString(texts[tag.number - kIssueType]);
    } else if (!reader.skipField(tag.number, tag.wireType)) {
      break;
    }
  }
  if (reader.hasError()) return std::nullopt;
  std::string json =
      "{\"issue_type\":" + tools::quoted(texts[0]) + ",\"node\":" + tools::quoted(texts[1]) +
      ",\"rtaid_client\":" + tools::quoted(texts[2]) + ",\"duration\":" + std::to_string(duration);
  if (timestamp) json += ",\"timestamp\":" + std::to_string(*timestamp);
  return json + "}";
}

std::string metricID(std::int64_t metric) {
  std::array<char, 24> text{};
  std::snprintf(text.data(), text.size(), "0x%llX", static_cast<unsigned long long>(metric));
  return text.data();
}

std::vector<RowCell> metricCells(const StoredRecord& record) {
  const std::int64_t metric = record.number(store::kMetricID);
  const std::string& bytes = record.text(store::kMetricMessage);
  const auto fields = metric == kAudioIssueDetected ? audioIssueAsJson(bytes) : std::nullopt;
  return {{.text = metricID(metric), .look = RowCell::Look::kName},
          {.text = fields ? fieldsOfJson(*fields) : hexadecimal(bytes)}};
}

std::vector<RowCell> linkCells(const StoredRecord& record) {
  const std::string type = linkTypeName(record);
  const bool isProblem = type == "Error" || type == "IssueDetector";
  return {{.text = std::to_string(record.number(store::kLinkSessionID))},
          {.text = harmlessText(record.text(store::kLinkServiceName))},
          {.text = linkCategoryName(record) + "/" + type,
           .look = isProblem ? RowCell::Look::kProblem : RowCell::Look::kName,
           .keepsEnd = true},
          {.text = fieldsOfJson(record.text(store::kLinkPayload))}};
}

// The columns in which the store guarantees complete JSON on one line.
bool isJson(std::string_view column) { return column == "payload" || column == "signature"; }

RecordFilter filterOf(const ShowRecords& request) {
  RecordFilter filter = filterOf(request.selection);
  const auto add = [&](std::size_t column, const std::vector<std::int64_t>& numbers) {
    if (!numbers.empty()) filter.numbers.push_back({column, numbers});
  };
  switch (request.kind) {
    case ShowRecords::Kind::kMetrics:
      add(store::kMetricID, request.ids);
      break;
    case ShowRecords::Kind::kPower:
      add(store::kPowerCategory, request.categories);
      break;
    case ShowRecords::Kind::kLink:
      add(store::kLinkSessionID, request.ids);
      add(store::kLinkType, request.types);
      // The store's filter compares numbers, but the stored category has no domain. The domain must
      // be read from the payload, record by record.
      if (!request.categories.empty()) {
        filter.accepts = [categories = request.categories](const StoredRecord& record) {
          return isOfCategory(record, categories);
        };
      }
      break;
    case ShowRecords::Kind::kSnapshots:
      break;
  }
  if (const auto& grep = request.selection.grep) {
    filter.accepts = [grep, others = filter.accepts](const StoredRecord& record) {
      const bool matches =
          std::ranges::any_of(record.fields, [&](const StoredRecord::Field& field) {
            const auto* text = std::get_if<std::string>(&field);
            return text != nullptr && grep->matches(*text);
          });
      return matches && (!others || others(record));
    };
  }
  return filter;
}

class RecordReading final : public StoreReading {
 public:
  explicit RecordReading(ShowRecords::Kind kind) : kind_(kind), table_(tableOf(kind)) {}

  Outcome find(StoreReader& reader, const RecordFilter& filter,
               const RowCallback& callback) override {
    return reader.forEachRecord(
        table_, filter, [&](const StoredRecord& record) { callback(record.id, record.time); });
  }
  Outcome printAll(StoreReader& reader, const RecordFilter& filter, RowPrinter& printer) override {
    return reader.forEachRecord(table_, filter,
                                [&](const StoredRecord& record) { print(record, printer); });
  }
  Outcome printAdded(EventFollower& follower, RowPrinter& printer) override {
    return follower.deliver(table_, [&](const StoredRecord& record) { print(record, printer); });
  }

 private:
  void print(const StoredRecord& record, RowPrinter& printer) const {
    printer.print(
        record.id, record.time, [&] { return recordCells(kind_, record); },
        [&] { return recordJson(kind_, record); });
  }

  ShowRecords::Kind kind_;
  const RecordTable& table_;
};

}  // namespace

std::vector<RowCell> recordCells(ShowRecords::Kind kind, const StoredRecord& record) {
  switch (kind) {
    case ShowRecords::Kind::kMetrics:
      return metricCells(record);
    case ShowRecords::Kind::kPower:
      return {
          {.text = std::to_string(record.number(store::kPowerCategory))},
          {.text = harmlessText(record.text(store::kPowerEventName)), .look = RowCell::Look::kName},
          {.text = fieldsOfJson(record.text(store::kPowerPayload))}};
    case ShowRecords::Kind::kLink:
      return linkCells(record);
    case ShowRecords::Kind::kSnapshots:
      return {{.text = harmlessText(record.text(store::kSnapshotPath)), .keepsEnd = true},
              {.text = fieldsOfJson(record.text(store::kSnapshotSignature))}};
  }
  return {};
}

std::string recordJson(ShowRecords::Kind kind, const StoredRecord& record) {
  const auto columns = tableOf(kind).columns;
  std::string json = "{\"time\":" + toJson(record.time);
  for (std::size_t field = 0; field < columns.size(); ++field) {
    json.append(",\"").append(columns[field].name).append("\":");
    switch (columns[field].type) {
      case store::ColumnType::kInteger:
        json += std::to_string(record.number(field));
        break;
      case store::ColumnType::kText:
        json += harmlessJson(isJson(columns[field].name) ? record.text(field)
                                                         : tools::quoted(record.text(field)));
        break;
      case store::ColumnType::kBytes:
        json += tools::quoted(hexadecimal(record.text(field)));
        break;
    }
  }
  const bool isIssue =
      kind == ShowRecords::Kind::kMetrics && record.number(store::kMetricID) == kAudioIssueDetected;
  const auto fields = isIssue ? audioIssueAsJson(record.text(store::kMetricMessage)) : std::nullopt;
  // The bytes stay in the object: they are what was recorded, the fields are our reading of them.
  if (fields) json += ",\"fields\":" + harmlessJson(*fields);
  if (kind == ShowRecords::Kind::kLink) {
    json += ",\"category_name\":" + tools::quoted(linkCategoryName(record)) +
            ",\"type_name\":" + tools::quoted(linkTypeName(record));
  }
  return json + "}";
}

ExitStatus showRecords(const ShowRecords& request, OutputForm form, std::ostream& out,
                       int outputDescriptor, std::ostream& errors) {
  RecordReading reading(request.kind);
  return runOverStore(
      {commandOf(request.kind), form, request.selection, out, outputDescriptor, errors},
      filterOf(request), reading);
}

}  // namespace halvox::tools
