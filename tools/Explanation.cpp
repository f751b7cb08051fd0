#include "tools/Explanation.h"

#include <algorithm>
#include <string_view>
#include <utility>

#include "tools/JsonText.h"
#include "tools/TextTable.h"

namespace halvox::tools {
namespace {

using Sink = Explanation::Sink;
using Setting = Explanation::Setting;

// A page that is wider is tiring to read.
constexpr std::size_t kWidest = 100;
constexpr std::size_t kNarrowest = 20;
constexpr std::size_t kIndent = 2;

std::string_view tookText(Sink::Took took) {
  switch (took) {
    case Sink::Took::kYes:
      return "yes";
    case Sink::Took::kNo:
      return "no";
    case Sink::Took::kUnknown:
      return "unknown";
  }
  return {};
}

std::string idText(std::int64_t id) { return id == 0 ? "" : std::to_string(id); }

std::string countText(const Sink& sink) {
  return sink.messages ? std::to_string(*sink.messages) : "";
}

void printSentences(std::ostream& out, const char* heading,
                    const std::vector<std::string>& sentences, std::size_t width) {
  if (sentences.empty()) return;
  out << '\n' << wrapped(heading, width, 0);
  for (const std::string& sentence : sentences) out << wrapped(sentence, width, kIndent);
}

void printSinks(std::ostream& out, const std::vector<Sink>& sinks, std::size_t width,
                std::optional<std::size_t> terminal) {
  const bool areCounted =
      std::ranges::any_of(sinks, [](const Sink& sink) { return sink.messages.has_value(); });
  std::vector<TextTable::Column> columns{{.heading = "SINK", .least = 12}, {.heading = "TOOK IT"}};
  if (areCounted) {
    columns.push_back({.heading = "MESSAGES", .align = TextTable::Align::kRight, .rank = 1});
  }
  columns.push_back({.heading = "RECORD", .align = TextTable::Align::kRight, .rank = 2});
  TextTable table(std::move(columns));
  for (const Sink& sink : sinks) {
    std::vector<std::string> row{harmlessText(sink.name), std::string(tookText(sink.took))};
    if (areCounted) row.push_back(countText(sink));
    row.push_back(idText(sink.record));
    table.add(std::move(row));
  }
  out << '\n';
  table.print(out, terminal);
  out << "\nWhy\n";
  for (const Sink& sink : sinks) {
    if (!sink.why.empty()) out << wrapped(sink.name + ": " + sink.why, width, kIndent);
  }
}

void printSettings(std::ostream& out, const std::vector<Setting>& settings, std::size_t width,
                   std::optional<std::size_t> terminal) {
  if (settings.empty()) return;
  TextTable table({{.heading = "SETTING", .least = 12}, {.heading = "VALUE", .least = 8}});
  for (const Setting& setting : settings) {
    table.add({harmlessText(setting.key), harmlessText(setting.value)});
  }
  out << '\n';
  table.print(out, terminal);
  out << '\n';
  for (const Setting& setting : settings) {
    if (!setting.effect.empty()) out << wrapped(setting.effect, width, kIndent);
  }
}

std::string textJson(std::string_view text) { return harmlessJson(tools::quoted(text)); }

std::string listJson(const std::vector<std::string>& texts) {
  std::string json = "[";
  for (const std::string& text : texts) json += (json.size() > 1 ? "," : "") + textJson(text);
  return json + "]";
}

std::string sinkJson(const Sink& sink) {
  return "{\"sink\":" + textJson(sink.name) + ",\"took\":" + textJson(tookText(sink.took)) +
         ",\"messages\":" + (sink.messages ? std::to_string(*sink.messages) : "null") +
         ",\"record\":" + (sink.record == 0 ? "null" : std::to_string(sink.record)) +
         ",\"why\":" + textJson(sink.why) + "}";
}

}  // namespace

std::string wrapped(const std::string& text, std::size_t width, std::size_t indent) {
  const std::string harmless = harmlessText(text);
  const std::string margin(indent, ' ');
  std::string lines;
  std::string line = margin;
  std::size_t used = indent;
  for (std::size_t begin = 0; begin < harmless.size();) {
    const std::size_t end = std::min(harmless.find(' ', begin), harmless.size());
    const std::string word = harmless.substr(begin, end - begin);
    const std::size_t length = displayWidth(word);
    const bool isFirst = used == indent;
    if (!isFirst && used + 1 + length > width) {
      lines += line + '\n';
      line = margin + word;
      used = indent + length;
    } else {
      line += (isFirst ? "" : " ") + word;
      used += length + (isFirst ? 0 : 1);
    }
    begin = end + 1;
  }
  return lines + line + '\n';
}

void printExplanation(const Explanation& explanation, std::ostream& out,
                      std::optional<std::size_t> width) {
  const std::size_t columns = std::clamp(width.value_or(kWidest), kNarrowest, kWidest);
  out << wrapped(explanation.subject, columns, 0);
  printSentences(out, "Name", explanation.name, columns);
  printSentences(out, "Sessions and repetitions", explanation.sessions, columns);
  if (!explanation.sinks.empty()) printSinks(out, explanation.sinks, columns, width);
  printSettings(out, explanation.settings, columns, width);
  printSentences(out, "What the store does not show", explanation.unknown, columns);
}

std::string explanationJson(const Explanation& explanation) {
  std::string json = "{\"explains\":" + textJson(explanation.kind) +
                     ",\"subject\":" + textJson(explanation.subject) +
                     ",\"name\":" + listJson(explanation.name) +
                     ",\"sessions\":" + listJson(explanation.sessions) + ",\"sinks\":[";
  std::string_view comma;
  for (const Sink& sink : explanation.sinks) {
    json += std::string(std::exchange(comma, ",")) + sinkJson(sink);
  }
  json += "],\"settings\":[";
  comma = {};
  for (const Setting& setting : explanation.settings) {
    json += std::string(std::exchange(comma, ",")) + "{\"key\":" + textJson(setting.key) +
            ",\"value\":" + textJson(setting.value) + ",\"effect\":" + textJson(setting.effect) +
            "}";
  }
  return json + "],\"unknown\":" + listJson(explanation.unknown) + "}";
}

}  // namespace halvox::tools
