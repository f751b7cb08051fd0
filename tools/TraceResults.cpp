#include "tools/TraceResults.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <fstream>
#include <limits>

#include <rapidjson/document.h>
#include <rapidjson/istreamwrapper.h>
#include <rapidjson/ostreamwrapper.h>
#include <rapidjson/writer.h>

#include "platform/linux/base/ErrnoText.h"

namespace halvox::tools {
namespace {

using platform::linux_::errnoText;
using platform::linux_::Failure;
using platform::linux_::Result;
using Writer = rapidjson::Writer<rapidjson::OStreamWrapper>;

constexpr double kNanosecondsPerMicrosecond = 1000;
constexpr int kProcess = 1;

std::string textOf(const rapidjson::Value& value) {
  return {value.GetString(), value.GetStringLength()};
}

// Writes the name of a track; track 0 is the process itself.
void writeName(Writer& json, int track, const std::string& name) {
  json.StartObject();
  json.Key("ph");
  json.String("M");
  json.Key("name");
  json.String(track == 0 ? "process_name" : "thread_name");
  json.Key("pid");
  json.Int(kProcess);
  json.Key("tid");
  json.Int(track);
  json.Key("args");
  json.StartObject();
  json.Key("name");
  json.String(name.data(), static_cast<rapidjson::SizeType>(name.size()));
  json.EndObject();
  json.EndObject();
}

void writeInterval(Writer& json, int track, const std::string& name, double start, double length) {
  json.StartObject();
  json.Key("ph");
  json.String("X");
  json.Key("name");
  json.String(name.data(), static_cast<rapidjson::SizeType>(name.size()));
  json.Key("cat");
  json.String("interval");
  json.Key("pid");
  json.Int(kProcess);
  json.Key("tid");
  json.Int(track);
  json.Key("ts");
  json.Double(start / kNanosecondsPerMicrosecond);
  json.Key("dur");
  json.Double(length / kNanosecondsPerMicrosecond);
  json.EndObject();
}

Failure<> notResults(const std::string& file) {
  return {file + ": is not a results file of a trace"};
}

}  // namespace

Result<TraceResults> readTraceResults(const std::string& file) {
  std::ifstream stream(file);
  // Opening a directory succeeds. Only reading shows the error.
  if (stream) static_cast<void>(stream.peek());
  if (stream.bad() || !stream.is_open()) return Failure<>{file + ": " + errnoText(errno)};
  rapidjson::IStreamWrapper input(stream);
  rapidjson::Document document;
  constexpr unsigned kFlags = rapidjson::kParseFullPrecisionFlag |
                              rapidjson::kParseValidateEncodingFlag |
                              rapidjson::kParseIterativeFlag;
  document.ParseStream<kFlags>(input);
  if (document.HasParseError() || !document.IsObject()) return notResults(file);
  const auto has = [&](const char* name) { return document.HasMember(name); };
  // Another JSON file must not pass for results. Everything that the service writes must therefore
  // be there.
  if (!has("product") || !document["product"].IsString() || !has("unit") ||
      !document["unit"].IsString() || textOf(document["unit"]) != "ns" || !has("values") ||
      !document["values"].IsObject()) {
    return notResults(file);
  }
  TraceResults results{.product = textOf(document["product"])};
  const rapidjson::Value& values = document["values"];
  const auto members = values.MemberBegin();
  for (rapidjson::SizeType index = 0; index < values.MemberCount(); ++index) {
    const auto& member = members[static_cast<std::ptrdiff_t>(index)];
    if (!member.value.IsArray()) return notResults(file);
    auto& numbers = results.values.emplace_back(textOf(member.name), std::vector<double>()).second;
    for (const auto& value : member.value.GetArray()) {
      if (value.IsNumber()) numbers.push_back(value.GetDouble());
    }
  }
  return results;
}

std::filesystem::path traceResultsFile(const std::filesystem::path& root) {
  return root /
         "private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Traces/tracing_results.ssj";
}

TraceStatistics statisticsOf(std::vector<double> values) {
  std::ranges::sort(values);
  const auto atRank = [&](double share) {
    // This is the nearest-rank method, by which every figure is a value that was measured.
    const auto rank = static_cast<std::size_t>(std::ceil(share * double(values.size())));
    return values[std::max<std::size_t>(rank, 1) - 1];
  };
  return {.count = values.size(),
          .minimum = values.front(),
          .median = atRank(0.5),
          .percentile95 = atRank(0.95),
          .percentile99 = atRank(0.99),
          .maximum = values.back()};
}

void writeTraceEvents(const TraceResults& results, std::ostream& out) {
  rapidjson::OStreamWrapper wrapped(out);
  Writer json(wrapped);
  json.StartObject();
  json.Key("displayTimeUnit");
  json.String("ns");
  json.Key("traceEvents");
  json.StartArray();
  // Viewers group tracks by process; the file has one.
  writeName(json, 0, results.product);
  int track = 0;
  for (const auto& [name, values] : results.values) {
    writeName(json, ++track, name);
    double start = 0;
    for (const double value : values) {
      writeInterval(json, track, name, start, value);
      // JSON has no infinity.
      start = std::clamp(start + value, std::numeric_limits<double>::lowest(),
                         std::numeric_limits<double>::max());
    }
  }
  json.EndArray();
  json.EndObject();
  out << '\n';
}

}  // namespace halvox::tools
