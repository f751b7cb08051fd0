#include "tools/top/TopText.h"

#include <array>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <optional>
#include <sstream>

#include "tools/JsonText.h"
#include "tools/StreamText.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

constexpr const char* kUnknown = "-";
constexpr std::size_t kDateLength = 11;  // of "2026-11-21 22:44:05.123"
constexpr std::size_t kTimeLength = 8;

template <typename... Values>
std::string formatted(const char* format, Values... values) {
  std::array<char, 64> text{};
  std::snprintf(text.data(), text.size(), format, values...);
  return text.data();
}

std::string orUnknown(const std::string& text) {
  return text.empty() ? kUnknown : harmlessText(text);
}

template <typename Number>
std::string countText(const std::optional<Number>& number) {
  return number ? std::to_string(*number) : kUnknown;
}

std::string volumeText(const std::optional<double>& volume) {
  if (!volume) return kUnknown;
  return *volume == 0 ? std::string("muted") : formatted("%.2f", *volume);
}

std::string xrunsText(std::uint64_t xruns, double milliseconds) {
  if (xruns == 0) return "0";
  // Some clients report an xrun without its length.
  if (milliseconds == 0) return std::to_string(xruns);
  return std::to_string(xruns) + " (" + lostText(milliseconds) + ")";
}

// ---- JSON

std::string number(double value) { return toJson(platform::Value(value)); }

template <typename Number>
std::string orNull(const std::optional<Number>& value) {
  if (!value) return "null";
  if constexpr (std::is_floating_point_v<Number>) {
    return number(*value);
  } else {
    return std::to_string(*value);
  }
}

std::string serviceJson(const TopService& service) {
  return std::string("{\"connected\":") + (service.isConnected ? "true" : "false") +
         ",\"problem\":" + tools::quoted(service.problem) +
         ",\"uptime_seconds\":" + orNull(service.uptimeSeconds) +
         ",\"clients\":" + orNull(service.clients) + ",\"sessions\":" + orNull(service.sessions) +
         ",\"messages_per_second\":" + orNull(service.messagesPerSecond) +
         ",\"stored_per_second\":" + orNull(service.storedPerSecond) +
         ",\"waiting_jobs\":" + orNull(service.waitingJobs) +
         ",\"waiting_records\":" + orNull(service.waitingRecords) +
         ",\"store_bytes\":" + orNull(service.storeBytes) + "}";
}

std::string lossJson(const TopLoss& loss) {
  return "{\"piece\":" + tools::quoted(loss.piece) + ",\"reason\":" + tools::quoted(loss.reason) +
         ",\"total\":" + std::to_string(loss.total) + ",\"per_second\":" + orNull(loss.perSecond) +
         "}";
}

std::string deviceJson(const TopDevice& device) {
  return "{\"device\":" + tools::quoted(device.name) +
         ",\"description\":" + tools::quoted(device.description) +
         ",\"quantum\":" + orNull(device.quantum) + ",\"rate\":" + orNull(device.rate) +
         ",\"busy\":" + orNull(device.busy) +
         ",\"xruns_last_minute\":" + std::to_string(device.xruns) +
         ",\"streams\":" + std::to_string(device.streams) + "}";
}

std::string streamJson(const TopStream& stream) {
  return "{\"id\":" + std::to_string(stream.id) + ",\"session_id\":" + orNull(stream.sessionID) +
         ",\"application\":" + tools::quoted(stream.application) +
         ",\"service\":" + tools::quoted(stream.service) +
         ",\"direction\":" + tools::quoted(analysis::directionName(stream.direction)) +
         ",\"devices\":" + tools::quoted(stream.device) +
         ",\"device_node_names\":" + tools::quoted(stream.deviceNames) +
         ",\"volume\":" + orNull(stream.volume) + ",\"state\":\"" + stateName(stream.state) +
         "\",\"started\":" + number(stream.started) +
         ",\"xruns_last_minute\":" + std::to_string(stream.xruns) +
         ",\"lost_milliseconds_last_minute\":" + number(stream.lostMilliseconds) +
         ",\"xruns\":" + std::to_string(stream.xrunsInAll) + "}";
}

template <typename Element>
std::string listJson(const std::vector<Element>& elements,
                     std::string (*json)(const Element& element)) {
  std::string list;
  for (const Element& element : elements) list += (list.empty() ? "" : ",") + json(element);
  return "[" + list + "]";
}

}  // namespace

// Two digits are enough below 10; a person does not read more from a rate that changes.
std::string rateText(const std::optional<double>& perSecond) {
  if (!perSecond) return kUnknown;
  return formatted(*perSecond < 10 ? "%.1f/s" : "%.0f/s", *perSecond);
}

std::string bytesText(const std::optional<std::uint64_t>& bytes) {
  if (!bytes) return kUnknown;
  static constexpr std::array kUnits{"B", "KiB", "MiB", "GiB", "TiB"};
  constexpr double kStep = 1024;
  auto amount = static_cast<double>(*bytes);
  std::size_t unit = 0;
  while (amount >= kStep && unit + 1 < kUnits.size()) {
    amount /= kStep;
    ++unit;
  }
  return formatted(unit == 0 ? "%.0f %s" : "%.1f %s", amount, kUnits[unit]);
}

std::vector<std::string> serviceTexts(const TopSnapshot& snapshot) {
  const TopService& service = snapshot.service;
  std::vector<std::string> texts{localTime(snapshot.time).substr(kDateLength, kTimeLength)};
  if (!service.problem.empty()) texts.push_back(harmlessText(service.problem));
  if (service.uptimeSeconds) texts.push_back("up " + durationText(*service.uptimeSeconds));
  if (service.isConnected) {
    texts.push_back("clients " + countText(service.clients));
    texts.push_back("sessions " + countText(service.sessions));
    texts.push_back("messages " + rateText(service.messagesPerSecond));
    texts.push_back("stored " + rateText(service.storedPerSecond));
    texts.push_back("waiting jobs " + countText(service.waitingJobs));
    texts.push_back("waiting records " + countText(service.waitingRecords));
  }
  texts.push_back("store " + bytesText(service.storeBytes));
  return texts;
}

std::vector<std::string> lossTexts(const std::vector<TopLoss>& losses) {
  std::vector<std::string> texts;
  for (const TopLoss& loss : losses) {
    std::string& text = texts.emplace_back(harmlessText(loss.piece + ", " + loss.reason));
    text += " " + std::to_string(loss.total);
    if (loss.perSecond.value_or(0) > 0) text += " (+" + rateText(loss.perSecond) + ")";
  }
  return texts;
}

TextTable deviceTable(const std::vector<TopDevice>& devices) {
  using Align = TextTable::Align;
  TextTable table({{.heading = "DEVICE", .least = 12},
                   {.heading = "QUANTUM", .align = Align::kRight, .rank = 2},
                   {.heading = "RATE", .align = Align::kRight, .rank = 3},
                   {.heading = "BUSY", .align = Align::kRight},
                   {.heading = "XRUNS", .align = Align::kRight},
                   {.heading = "STREAMS", .align = Align::kRight, .rank = 4}});
  for (const TopDevice& device : devices) {
    constexpr double kPercent = 100;
    table.add({orUnknown(device.description.empty() ? device.name : device.description),
               countText(device.quantum), countText(device.rate),
               device.busy ? formatted("%.1f%%", *device.busy * kPercent) : kUnknown,
               std::to_string(device.xruns), std::to_string(device.streams)});
  }
  return table;
}

TextTable streamTable(const std::vector<TopStream>& streams) {
  using Align = TextTable::Align;
  TextTable table({{.heading = "APP", .least = 10},
                   {.heading = "SERVICE", .least = 8, .rank = 3},
                   {.heading = "DIRECTION", .rank = 4},
                   {.heading = "DEVICE", .least = 8, .rank = 1},
                   {.heading = "VOLUME", .align = Align::kRight, .rank = 2},
                   {.heading = "STATE"},
                   {.heading = "XRUNS", .align = Align::kRight}});
  for (const TopStream& stream : streams) {
    table.add({orUnknown(stream.application), orUnknown(stream.service),
               orUnknown(std::string(analysis::directionName(stream.direction))),
               orUnknown(stream.device.empty() ? stream.deviceNames : stream.device),
               volumeText(stream.volume), stateName(stream.state),
               xrunsText(stream.xruns, stream.lostMilliseconds)});
  }
  return table;
}

std::string batchText(const TopSnapshot& snapshot) {
  std::ostringstream out;
  std::string line;
  for (const std::string& text : serviceTexts(snapshot)) line += (line.empty() ? "" : "  ") + text;
  out << line << '\n';
  for (const std::string& text : lossTexts(snapshot.losses)) out << text << '\n';
  if (!snapshot.devices.empty()) deviceTable(snapshot.devices).print(out, std::nullopt);
  if (!snapshot.streams.empty()) streamTable(snapshot.streams).print(out, std::nullopt);
  out << '\n';
  return out.str();
}

std::string batchJson(const TopSnapshot& snapshot) {
  return harmlessJson("{\"time\":" + number(snapshot.time) + ",\"seconds\":" +
                      number(snapshot.seconds) + ",\"service\":" + serviceJson(snapshot.service) +
                      ",\"losses\":" + listJson(snapshot.losses, lossJson) +
                      ",\"devices\":" + listJson(snapshot.devices, deviceJson) +
                      ",\"streams\":" + listJson(snapshot.streams, streamJson) + "}");
}

}  // namespace halvox::tools
