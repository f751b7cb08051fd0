#include "tools/export/CsvWriter.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/base/Hexadecimal.h"
#include "platform/linux/base/Utf8.h"
#include "tools/export/RecordKinds.h"
#include "tools/export/RecordTime.h"

namespace halvox::tools {
namespace {

using platform::linux_::hexadecimal;
using platform::linux_::StoredItem;

constexpr std::string_view kHeader =
    "kind,id,time,time_utc,application,name,session_id,client_name,service_name,category,type,"
    "metric_id,payload,path,reason,count";
constexpr std::string_view kLineEnd = "\r\n";

// What spreadsheets take for the beginning of a formula. Some skip a tab or a line break first, and
// some read the full-width forms, which Japanese keyboards type, like the others.
bool beginsLikeFormula(std::string_view text) {
  if (text.empty()) return false;
  if (std::string_view("=+-@\t\r\n").find(text.front()) != std::string_view::npos) return true;
  for (const std::string_view form : {"\uFF1D", "\uFF0B", "\uFF0D", "\uFF20"}) {
    if (text.starts_with(form)) return true;
  }
  return false;
}

// Appends the fields of one line.
class Line {
 public:
  explicit Line(std::string& text) : text_(text) {}

  // A text from a client.
  Line& name(std::string_view field) {
    std::string valid = platform::linux_::replaceInvalidUtf8(field);
    if (beginsLikeFormula(valid)) valid.insert(valid.begin(), '\'');
    return plain(valid);
  }
  Line& number(std::optional<std::int64_t> field) {
    return plain(field ? std::to_string(*field) : std::string());
  }
  // A text that cannot begin like a formula.
  Line& plain(std::string_view field) {
    if (!isFirst_) text_ += ',';
    isFirst_ = false;
    if (field.find_first_of(",\"\r\n") == std::string_view::npos) {
      text_ += field;
      return *this;
    }
    text_ += '"';
    for (const char letter : field) {
      if (letter == '"') text_ += '"';
      text_ += letter;
    }
    text_ += '"';
    return *this;
  }
  void end() { text_ += kLineEnd; }

 private:
  std::string& text_;
  bool isFirst_ = true;
};

class CsvWriter final : public RecordWriter {
 public:
  void begin(std::string& text) override { text.append(kHeader).append(kLineEnd); }
  void finish(std::string& /*text*/) override {}

  void add(const StoredItem& item, std::string& text) override {
    const ExportKind kind = kindOf(item);
    const auto only = [&](bool has, std::int64_t number) {
      return has ? std::optional(number) : std::nullopt;
    };
    const bool isLink = kind == ExportKind::kLink;
    const bool isMetric = kind == ExportKind::kMetrics;
    const bool isLoss = kind == ExportKind::kLosses;
    const std::string_view payload = isLoss ? std::string_view() : item.payload;
    Line line(text);
    line.plain(wordOf(kind)).number(item.id).plain(timeNumber(item.time));
    line.plain(utcTime(item.time)).name(item.application).name(item.name);
    line.number(only(isLink, item.sessionID)).name(item.clientName).name(item.serviceName);
    line.number(only(isLink || kind == ExportKind::kPower, item.number));
    line.number(only(isLink, item.type)).number(only(isMetric, item.number));
    // A damaged payload need not begin with a brace.
    isMetric ? line.plain(hexadecimal(payload)) : line.name(payload);
    line.name(item.path).name(isLoss ? item.payload : std::string_view());
    line.number(only(isLoss, item.number)).end();
  }
};

}  // namespace

std::unique_ptr<RecordWriter> makeCsvWriter() { return std::make_unique<CsvWriter>(); }

}  // namespace halvox::tools
