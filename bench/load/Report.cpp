#include "bench/load/Report.h"

#include <algorithm>
#include <cstdio>

#include <rapidjson/prettywriter.h>
#include <rapidjson/stringbuffer.h>

namespace halvox::bench {
namespace {

std::string formatBound(const Measurement& measurement) {
  char text[64] = "";
  if (measurement.atMost) std::snprintf(text, sizeof text, "<= %g", *measurement.atMost);
  if (measurement.atLeast) std::snprintf(text, sizeof text, ">= %g", *measurement.atLeast);
  return text;
}

}  // namespace

double Measurement::compared() const { return echo ? value / *echo : value; }

bool Measurement::holds() const {
  return (!atMost || compared() <= *atMost) && (!atLeast || compared() >= *atLeast);
}

std::string formatTable(const std::vector<Measurement>& measurements) {
  std::string table;
  char line[256];
  std::snprintf(line, sizeof line, "%-52s %12s %12s %7s  %-9s %s\n", "", "service", "echo", "ratio",
                "bound", "");
  table += line;
  for (const Measurement& each : measurements) {
    char echo[32] = "";
    char ratio[32] = "";
    if (each.echo) {
      std::snprintf(echo, sizeof echo, "%.2f", *each.echo);
      std::snprintf(ratio, sizeof ratio, "%.2f", each.compared());
    }
    const bool bounded = each.atMost || each.atLeast;
    std::snprintf(line, sizeof line, "%-52s %12.2f %12s %7s  %-9s %s\n",
                  (each.name + ", " + each.unit).c_str(), each.value, echo, ratio,
                  formatBound(each).c_str(), bounded ? (each.holds() ? "holds" : "MISSED") : "");
    table += line;
  }
  return table;
}

std::string formatJson(const std::vector<Measurement>& measurements) {
  rapidjson::StringBuffer buffer;
  rapidjson::PrettyWriter<rapidjson::StringBuffer> writer(buffer);
  writer.StartArray();
  for (const Measurement& each : measurements) {
    writer.StartObject();
    writer.Key("name");
    writer.String(each.name.c_str());
    writer.Key("unit");
    writer.String(each.unit.c_str());
    writer.Key("value");
    writer.Double(each.value);
    if (each.echo) {
      writer.Key("echo");
      writer.Double(*each.echo);
      writer.Key("ratio");
      writer.Double(each.compared());
    }
    writer.EndObject();
  }
  writer.EndArray();
  return buffer.GetString();
}

double median(std::vector<double> values) { return percentile(std::move(values), 50); }

double percentile(std::vector<double> values, double percent) {
  if (values.empty()) return 0;
  const auto rank =
      static_cast<std::ptrdiff_t>(percent / 100.0 * static_cast<double>(values.size() - 1));
  std::nth_element(values.begin(), values.begin() + rank, values.end());
  return values[static_cast<std::size_t>(rank)];
}

}  // namespace halvox::bench
