#include "tools/export/OtlpWriter.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <string>

#include "analysis/IssueMetric.h"
#include "analysis/MessageNames.h"
#include "analysis/Payload.h"

#include "tools/export/OtlpValue.h"
#include "tools/export/RecordJson.h"
#include "tools/export/RecordKinds.h"

namespace halvox::tools {
namespace {

using platform::linux_::StoredItem;

// The service's own time of a message. The time of the record is that of storing.
constexpr const char* kStampKey = "hvreporting_timestamp";

// SeverityNumber of the data model, and its text.
struct Severity {
  int number;
  std::string_view text;
};
constexpr Severity kInfo{9, "INFO"};
constexpr Severity kWarning{13, "WARN"};
constexpr Severity kError{17, "ERROR"};

// Nanoseconds since 1970 as a text, which is how the encoding writes all 64-bit numbers. 0 means
// unknown: a clock that was set before 1970 or after 2500.
std::string unixNano(double seconds) {
  constexpr double kLast = 1.6e10;
  constexpr double kNanosecondsPerSecond = 1e9;
  if (!(seconds > 0 && seconds < kLast)) return "0";
  // A double has fewer digits than nanoseconds since 1970. The whole seconds are kept exact.
  const double whole = std::floor(seconds);
  const auto fraction =
      static_cast<std::uint64_t>(std::llround((seconds - whole) * kNanosecondsPerSecond));
  return std::to_string(static_cast<std::uint64_t>(whole) * 1'000'000'000U + fraction);
}

std::string base64(std::string_view bytes) {
  constexpr std::string_view kDigits =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  constexpr std::size_t kGroup = 3;
  std::string text;
  text.reserve((bytes.size() + 2) / kGroup * 4);
  for (; !bytes.empty(); bytes.remove_prefix(std::min(kGroup, bytes.size()))) {
    std::uint32_t group = 0;
    for (std::size_t index = 0; index < kGroup; ++index) {
      group = group << 8U | (index < bytes.size() ? static_cast<unsigned char>(bytes[index]) : 0U);
    }
    for (std::size_t digit = 0; digit < 4; ++digit) {
      text += digit <= bytes.size() ? kDigits[group >> (18 - 6 * digit) & 63U] : '=';
    }
  }
  return text;
}

class OtlpWriter final : public RecordWriter {
 public:
  explicit OtlpWriter(std::string_view version) : version_(version), writer_(buffer_) {}

  void begin(std::string& /*text*/) override {}

  void add(const StoredItem& item, std::string& text) override {
    if (records_ == kMostOtlpRecords || buffer_.GetSize() >= kMostOtlpBytes) endRequest(text);
    if (records_++ == 0) beginRequest();
    writeRecord(item);
  }
  void finish(std::string& text) override {
    if (records_ > 0) endRequest(text);
  }

 private:
  void beginRequest() {
    buffer_.Clear();
    writer_.Reset(buffer_);
    beginObjects("resourceLogs");
    writeKey(writer_, "resource");
    writer_.StartObject();
    beginAttributes();
    addAttribute("service.name", std::string_view("halvox-reportingd"));
    writer_.EndArray();
    writer_.EndObject();
    beginObjects("scopeLogs", IsFirst::kNo);
    writeKey(writer_, "scope");
    writer_.StartObject();
    addText("name", "halvoxctl");
    addText("version", version_);
    writer_.EndObject();
    writeKey(writer_, "logRecords");
    writer_.StartArray();
  }

  void endRequest(std::string& text) {
    writer_.EndArray();
    for (int depth = 0; depth < 2; ++depth) {
      writer_.EndObject();
      writer_.EndArray();
    }
    writer_.EndObject();
    text.append(buffer_.GetString(), buffer_.GetSize());
    text += '\n';
    buffer_.Clear();
    records_ = 0;
  }

  void writeRecord(const StoredItem& item) {
    const ExportKind kind = kindOf(item);
    // The bytes of a metric and the reason of a loss are not JSON.
    const bool hasJson = kind != ExportKind::kMetrics && kind != ExportKind::kLosses;
    payload_.show(hasJson ? item.payload : std::string_view());
    const Severity severity = severityOf(kind, item);
    writer_.StartObject();
    addText("timeUnixNano", unixNano(payload_.number(kStampKey).value_or(item.time)));
    addText("observedTimeUnixNano", unixNano(item.time));
    writeKey(writer_, "severityNumber");
    writer_.Int(severity.number);
    addText("severityText", severity.text);
    // The name of a loss is that of the piece of the service that counted it.
    if (!item.name.empty() && kind != ExportKind::kLosses) addText("eventName", item.name);
    writeKey(writer_, "body");
    if (kind == ExportKind::kMetrics) {
      writer_.StartObject();
      addText("bytesValue", base64(item.payload));
      writer_.EndObject();
    } else if (kind == ExportKind::kLosses) {
      writer_.StartObject();
      addText("stringValue", item.payload);
      writer_.EndObject();
    } else {
      writeOtlpValue(writer_, item.payload);
    }
    beginAttributes();
    addAttributes(kind, item);
    writer_.EndArray();
    writer_.EndObject();
  }

  // What a collector's rules usually ask for first.
  Severity severityOf(ExportKind kind, const StoredItem& item) const {
    std::string_view type;
    if (kind == ExportKind::kLosses) return kWarning;
    if (kind == ExportKind::kMetrics) {
      return item.number == analysis::kAudioIssueDetected ? kWarning : kInfo;
    }
    if (kind == ExportKind::kEvents) type = analysis::splitEventName(item.name).type;
    if (kind == ExportKind::kLink) {
      type = analysis::linkMessageNames(item.number, item.type, payload_).type;
    }
    if (type == "IssueDetector") return kWarning;
    return type == "Error" ? kError : kInfo;
  }

  void addAttributes(ExportKind kind, const StoredItem& item) {
    addAttribute("halvox.kind", wordOf(kind));
    addAttribute("halvox.record.id", item.id);
    if (!item.application.empty()) addAttribute("halvox.application", item.application);
    switch (kind) {
      case ExportKind::kEvents:
        break;
      case ExportKind::kMetrics:
        addAttribute("halvox.metric.id", item.number);
        break;
      case ExportKind::kPower:
        addAttribute("halvox.power.category", item.number);
        break;
      case ExportKind::kLink: {
        const auto names = analysis::linkMessageNames(item.number, item.type, payload_);
        addAttribute("halvox.session.id", item.sessionID);
        addAttribute("halvox.client.name", item.clientName);
        addAttribute("halvox.service.name", item.serviceName);
        addAttribute("halvox.category", names.category);
        addAttribute("halvox.type", names.type);
        break;
      }
      case ExportKind::kSnapshots:
        addAttribute("halvox.snapshot.path", item.path);
        break;
      case ExportKind::kLosses:
        addAttribute("halvox.loss.piece", item.name);
        addAttribute("halvox.loss.count", item.number);
        break;
    }
  }

  enum class IsFirst : std::uint8_t { kNo, kYes };
  // {"name":[{
  void beginObjects(std::string_view name, IsFirst isFirst = IsFirst::kYes) {
    if (isFirst == IsFirst::kYes) writer_.StartObject();
    writeKey(writer_, name);
    writer_.StartArray();
    writer_.StartObject();
  }
  void beginAttributes() {
    writeKey(writer_, "attributes");
    writer_.StartArray();
  }
  void addText(std::string_view key, std::string_view text) {
    writeKey(writer_, key);
    writeText(writer_, text);
  }
  void addAttribute(std::string_view key, std::string_view value) {
    addAttribute(key, "stringValue", value);
  }
  void addAttribute(std::string_view key, std::int64_t value) {
    addAttribute(key, "intValue", std::to_string(value));
  }
  void addAttribute(std::string_view key, std::string_view type, std::string_view value) {
    writer_.StartObject();
    addText("key", key);
    writeKey(writer_, "value");
    writer_.StartObject();
    addText(type, value);
    writer_.EndObject();
    writer_.EndObject();
  }

  const std::string version_;
  JsonBuffer buffer_;
  JsonWriter writer_;
  analysis::Payload payload_;
  std::size_t records_ = 0;  // in the request
};

}  // namespace

std::unique_ptr<RecordWriter> makeOtlpWriter(std::string_view version) {
  return std::make_unique<OtlpWriter>(version);
}

}  // namespace halvox::tools
