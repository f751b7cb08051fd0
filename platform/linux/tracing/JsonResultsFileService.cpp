#include "platform/linux/tracing/JsonResultsFileService.h"

#include <cerrno>
#include <cmath>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include "platform/linux/base/Utf8.h"
#include "platform/linux/files/FileError.h"
#include "platform/linux/files/RootedDirectory.h"
#include "platform/linux/files/UnfinishedFile.h"
#include "platform/linux/tracing/TracingLog.h"

namespace halvox::platform::linux_ {
namespace {

using Text = rapidjson::StringBuffer;
using TextWriter = rapidjson::Writer<Text>;

void writeText(TextWriter& json, std::string_view text) {
  const std::string valid = replaceInvalidUtf8(text);
  json.String(valid.data(), static_cast<rapidjson::SizeType>(valid.size()));
}

// Splits a path into its directory and its name.
std::pair<std::string_view, std::string> split(std::string_view path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string_view::npos) return {"/", std::string(path)};
  return {path.substr(0, slash + 1), std::string(path.substr(slash + 1))};
}

// Keeps the values in memory until the file is finished, because the file lists them by name, but
// they arrive in any order.
class ResultsFile final : public Sswriter {
 public:
  ResultsFile(std::string_view product, std::uint32_t version)
      : product_(product), version_(version) {}

  // Creates the unfinished file, so that an unwritable directory is reported at the start.
  [[nodiscard]] std::optional<Error> begin(const RootedDirectory::Place& place, std::string name) {
    name_ = std::move(name);
    path_ = place.text() + (place.path.ends_with('/') ? "" : "/") + name_;
    // The file gets its name only at the end. An impossible name is reported now, before the trace.
    if (name_.empty() || name_ == "." || name_ == "..") return fileError("create", path_, EINVAL);
    RootedDirectory directory = RootedDirectory::open(place);
    if (directory.error.has_value()) return std::move(directory.error);
    const int error = file_.begin(std::move(directory.descriptor));
    return error == 0 ? std::nullopt : std::optional(fileError("create", path_, error));
  }

  void add(std::string_view name, double value) {
    const auto [place, isNew] = places_.try_emplace(std::string(name), values_.size());
    if (isNew) values_.emplace_back(name, std::vector<double>());
    values_[place->second].second.push_back(value);
  }

  [[nodiscard]] std::optional<Error> finish() {
    const std::string text = toJson();
    if (const int error = file_.write(text)) return fileError("write", path_, error);
    if (const int error = file_.finish(name_)) return fileError("finish", path_, error);
    return std::nullopt;
  }

 private:
  [[nodiscard]] std::string toJson() const {
    Text text;
    TextWriter json(text);
    json.StartObject();
    json.Key("product");
    writeText(json, product_);
    json.Key("version");
    json.Uint(version_);
    json.Key("unit");
    json.String("ns");
    json.Key("values");
    json.StartObject();
    for (const auto& [name, values] : values_) {
      writeText(json, name);
      json.StartArray();
      for (const double value : values) {
        // JSON has no NaN and no infinities. null keeps the value's place in its list.
        std::isfinite(value) ? json.Double(value) : json.Null();
      }
      json.EndArray();
    }
    json.EndObject();
    json.EndObject();
    return std::string(text.GetString(), text.GetSize()) + "\n";
  }

  const std::string product_;
  const std::uint32_t version_;
  std::string name_;
  std::string path_;
  UnfinishedFile file_;
  std::map<std::string, std::size_t, std::less<>> places_;  // positions in `values_`
  std::vector<std::pair<std::string, std::vector<double>>> values_;
};

}  // namespace

JsonResultsFileService::JsonResultsFileService(std::filesystem::path root, LogService& log,
                                               StatisticsService& statistics)
    : root_(std::move(root)),
      log_(tracingLog(log, "JsonResultsFileService")),
      begun_(statistics.counter("results files", "files begun")),
      written_(statistics.counter("results files", "files written")),
      failed_(statistics.counter("results files", "files that failed")),
      values_(statistics.counter("results files", "values taken")) {}

ResultsFileService::Writer JsonResultsFileService::sswriter_open(std::string_view path,
                                                                 std::string_view productName,
                                                                 std::uint32_t version,
                                                                 std::uint32_t /*flags*/) {
  begun_.add();
  auto [directory, name] = split(path);
  auto file = std::make_unique<ResultsFile>(productName, version);
  const auto error = file->begin({root_, directory}, std::move(name));
  if (!error.has_value()) return file;
  failed_.add();
  log_.error("cannot write a results file: ", error->description, "; its values are lost");
  return nullptr;
}

void JsonResultsFileService::sswriter_new_value(Sswriter& writer, std::string_view name,
                                                ssunit /*unit*/, double value) {
  values_.add();
  dynamic_cast<ResultsFile&>(writer).add(name, value);
}

void JsonResultsFileService::sswriter_close(Writer writer) {
  if (writer == nullptr) return;
  const auto error = dynamic_cast<ResultsFile&>(*writer).finish();
  (error.has_value() ? failed_ : written_).add();
  if (error.has_value()) {
    log_.error("cannot write a results file: ", error->description, "; its values are lost");
  }
}

}  // namespace halvox::platform::linux_
