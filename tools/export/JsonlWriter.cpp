#include "tools/export/JsonlWriter.h"

#include "platform/linux/base/Hexadecimal.h"
#include "tools/export/RecordJson.h"
#include "tools/export/RecordKinds.h"

namespace halvox::tools {
namespace {

using platform::linux_::hexadecimal;
using platform::linux_::StoredItem;

class JsonlWriter final : public RecordWriter {
 public:
  void begin(std::string& /*text*/) override {}
  void finish(std::string& /*text*/) override {}

  void add(const StoredItem& item, std::string& text) override {
    buffer_.Clear();
    JsonWriter writer(buffer_);
    const ExportKind kind = kindOf(item);
    writer.StartObject();
    writeKey(writer, "kind");
    writeText(writer, wordOf(kind));
    writeKey(writer, "id");
    writer.Int64(item.id);
    writeKey(writer, "time");
    writeTime(writer, item.time);
    writeColumns(writer, kind, item);
    writer.EndObject();
    text.append(buffer_.GetString(), buffer_.GetSize());
    text += '\n';
  }

 private:
  static void addText(JsonWriter& writer, std::string_view key, std::string_view text) {
    writeKey(writer, key);
    writeText(writer, text);
  }
  static void addNumber(JsonWriter& writer, std::string_view key, std::int64_t number) {
    writeKey(writer, key);
    writer.Int64(number);
  }
  static void addJson(JsonWriter& writer, std::string_view key, std::string_view json) {
    writeKey(writer, key);
    writeJson(writer, json);
  }

  static void writeColumns(JsonWriter& writer, ExportKind kind, const StoredItem& item) {
    switch (kind) {
      case ExportKind::kEvents:
        addText(writer, "name", item.name);
        addText(writer, "application", item.application);
        return addJson(writer, "payload", item.payload);
      case ExportKind::kMetrics:
        addNumber(writer, "metric_id", item.number);
        return addText(writer, "message", hexadecimal(item.payload));
      case ExportKind::kPower:
        addNumber(writer, "category_id", item.number);
        addText(writer, "event_name", item.name);
        return addJson(writer, "payload", item.payload);
      case ExportKind::kLink:
        addNumber(writer, "session_id", item.sessionID);
        addText(writer, "client_name", item.clientName);
        addText(writer, "service_name", item.serviceName);
        addNumber(writer, "category", item.number);
        addNumber(writer, "type", item.type);
        return addJson(writer, "payload", item.payload);
      case ExportKind::kSnapshots:
        addJson(writer, "signature", item.payload);
        return addText(writer, "path", item.path);
      case ExportKind::kLosses:
        addText(writer, "piece", item.name);
        addText(writer, "reason", item.payload);
        return addNumber(writer, "count", item.number);
    }
  }

  JsonBuffer buffer_;
};

}  // namespace

std::unique_ptr<RecordWriter> makeJsonlWriter() { return std::make_unique<JsonlWriter>(); }

}  // namespace halvox::tools
