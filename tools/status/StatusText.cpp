#include "tools/status/StatusText.h"

#include <algorithm>
#include <string_view>
#include <vector>

#include "tools/JsonText.h"
#include "tools/StreamText.h"
#include "tools/TextTable.h"
#include "tools/TimeText.h"
#include "tools/top/TopText.h"

namespace halvox::tools {
namespace {

constexpr double kHour = 3600;
constexpr double kDay = 24 * kHour;
constexpr std::size_t kSecondLength = 19;  // of "2026-11-21 22:44:05.123"
constexpr std::size_t kLabelWidth = 14;

// Writes lines "label  text". Lines that are too long for the terminal are continued below the
// text.
class Lines {
 public:
  explicit Lines(std::optional<std::size_t> width) : width_(width) {}

  void heading(const std::string& text) { append(text); }
  void add(std::string_view label, const std::vector<std::string>& parts) {
    std::string line = padded(label);
    bool isBegun = false;
    for (const std::string& part : parts) {
      // With the commas before and after the part.
      if (isBegun && !fits(displayWidth(line) + displayWidth(part) + 3)) {
        append(line + ",");
        line = padded("");
        isBegun = false;
      }
      line += (isBegun ? ", " : "") + part;
      isBegun = true;
    }
    append(line);
  }
  // Breaks a text between its words.
  void addText(std::string_view label, std::string_view text) {
    std::string line = padded(label);
    bool isBegun = false;
    while (!text.empty()) {
      const std::size_t end = std::min(text.find(' '), text.size());
      const std::string word(text.substr(0, end));
      text.remove_prefix(std::min(end + 1, text.size()));
      if (isBegun && !fits(displayWidth(line) + 1 + displayWidth(word))) {
        append(line);
        line = padded("");
        isBegun = false;
      }
      line += (isBegun ? " " : "") + word;
      isBegun = true;
    }
    append(line);
  }
  // A path is recognised by its end.
  void addPath(std::string_view label, const std::string& path, const std::string& note = {}) {
    const std::string text = harmlessText(path) + note;
    if (!width_) return append(padded(label) + text);
    const std::size_t room = *width_ > kLabelWidth ? *width_ - kLabelWidth : 1;
    append(padded(label) + cutToEnd(text, room));
  }
  [[nodiscard]] std::string text() const { return text_; }

 private:
  static std::string padded(std::string_view label) {
    std::string line(label);
    line.resize(std::max(line.size() + 1, kLabelWidth), ' ');
    return line;
  }
  [[nodiscard]] bool fits(std::size_t width) const { return !width_ || width <= *width_; }
  void append(const std::string& line) { text_ += (width_ ? cutTo(line, *width_) : line) + "\n"; }

  std::optional<std::size_t> width_;
  std::string text_;
};

std::string counted(const std::optional<std::uint64_t>& number) {
  return number ? std::to_string(*number) : "-";
}

std::optional<std::uint64_t> whole(const std::optional<double>& number) {
  if (!number) return std::nullopt;
  return static_cast<std::uint64_t>(*number);
}

std::string secondOf(double time) { return localTime(time).substr(0, kSecondLength); }

void addService(const ServiceStatus& status, Lines& lines) {
  const TopService& service = status.service;
  if (!service.isConnected) {
    lines.heading("The service does not run or answer.");
    lines.addText("reason", harmlessText(service.problem));
    return;
  }
  lines.heading("The service runs.");
  if (!service.problem.empty()) lines.addText("problem", harmlessText(service.problem));
  if (service.uptimeSeconds) {
    lines.add("since", {secondOf(status.now - *service.uptimeSeconds),
                        "up " + durationText(*service.uptimeSeconds)});
  }
  if (status.process) lines.add("process", {std::to_string(*status.process)});
  lines.add("now",
            {"clients " + counted(service.clients), "sessions " + counted(service.sessions)});
  lines.add("mean rates", {"messages " + rateText(service.messagesPerSecond),
                           "stored " + rateText(service.storedPerSecond)});
  lines.add("waiting",
            {"jobs " + counted(service.waitingJobs), "records " + counted(service.waitingRecords)});
  const ServiceCost& cost = status.cost;
  lines.add(
      "cost",
      {"CPU " + (cost.cpuSeconds ? durationText(*cost.cpuSeconds) : "-"),
       "wake-ups " + counted(whole(perPeriod(cost.wakeUps, service.uptimeSeconds, kHour))) +
           " per hour",
       "written " + bytesText(whole(perPeriod(cost.bytesWritten, service.uptimeSeconds, kDay))) +
           " per day"});
  if (status.losses.empty()) lines.add("not kept", {"nothing"});
  std::string_view label = "not kept";
  for (const TopLoss& loss : status.losses) {
    lines.addText(label, harmlessText(loss.piece) + ", " + harmlessText(loss.reason) + ": " +
                             std::to_string(loss.total));
    label = "";
  }
}

void addPlaces(const ServiceStatus& status, Lines& lines) {
  const ServicePlaces& places = status.places;
  lines.addPath("configuration", places.configuration,
                places.hasConfiguration ? "" : " (absent: defaults)");
  lines.addPath("socket", places.socket.empty() ? "-" : places.socket);
  lines.addPath("database", places.database);
  lines.addPath("summaries", places.summaries);
  lines.addPath("captures", places.captures);
}

std::string orNull(const std::optional<double>& number) {
  return number ? toJson(platform::Value(*number)) : "null";
}

std::string orNull(const std::optional<std::uint64_t>& number) {
  return number ? std::to_string(*number) : "null";
}

std::string placesJson(const ServicePlaces& places) {
  return "{\"configuration\":" + tools::quoted(places.configuration) +
         ",\"configuration_exists\":" + (places.hasConfiguration ? "true" : "false") +
         ",\"socket\":" + tools::quoted(places.socket) +
         ",\"database\":" + tools::quoted(places.database) +
         ",\"summaries\":" + tools::quoted(places.summaries) +
         ",\"captures\":" + tools::quoted(places.captures) + "}";
}

std::string diskJson(const ServiceStatus& status) {
  return "{\"database_bytes\":" + orNull(status.service.storeBytes) +
         ",\"database_limit_bytes\":" + std::to_string(status.storeLimitBytes) +
         ",\"retention_days\":" + std::to_string(status.retentionDays) +
         ",\"summaries_bytes\":" + orNull(status.summaryBytes) +
         ",\"captures_bytes\":" + orNull(status.captureBytes) +
         ",\"captures_kept\":" + std::to_string(status.keptCaptures) + "}";
}

std::string costJson(const ServiceStatus& status) {
  const ServiceCost& cost = status.cost;
  const auto& uptime = status.service.uptimeSeconds;
  return "{\"cpu_seconds\":" + orNull(cost.cpuSeconds) + ",\"wakeups\":" + orNull(cost.wakeUps) +
         ",\"wakeups_per_hour\":" + orNull(perPeriod(cost.wakeUps, uptime, kHour)) +
         ",\"bytes_written\":" + orNull(cost.bytesWritten) +
         ",\"bytes_written_per_day\":" + orNull(perPeriod(cost.bytesWritten, uptime, kDay)) + "}";
}

std::string lossesJson(const std::vector<TopLoss>& losses) {
  std::string list;
  for (const TopLoss& loss : losses) {
    list += (list.empty() ? "{\"piece\":" : ",{\"piece\":") + tools::quoted(loss.piece) +
            ",\"reason\":" + tools::quoted(loss.reason) +
            ",\"total\":" + std::to_string(loss.total) + "}";
  }
  return "[" + list + "]";
}

std::string offJson(const std::vector<SwitchedOff>& off) {
  std::string list;
  for (const SwitchedOff& one : off) {
    list += (list.empty() ? "{\"what\":" : ",{\"what\":") + tools::quoted(one.what) +
            ",\"why\":" + tools::quoted(one.why) + "}";
  }
  return "[" + list + "]";
}

}  // namespace

std::optional<double> perPeriod(std::optional<std::uint64_t> count,
                                std::optional<double> uptimeSeconds, double periodSeconds) {
  if (!count || !uptimeSeconds || *uptimeSeconds < 1) return std::nullopt;
  return static_cast<double>(*count) * periodSeconds / *uptimeSeconds;
}

std::string statusText(const ServiceStatus& status, std::optional<std::size_t> width) {
  Lines lines(width);
  addService(status, lines);
  lines.add("halvoxctl", {status.version});
  addPlaces(status, lines);
  lines.add("disk", {"database " + bytesText(status.service.storeBytes),
                     "at most " + bytesText(status.storeLimitBytes),
                     "kept " + std::to_string(status.retentionDays) + " days",
                     "summaries " + bytesText(status.summaryBytes),
                     "captures " + bytesText(status.captureBytes)});
  std::string_view label = "off";
  for (const SwitchedOff& one : status.off) {
    lines.addText(label, one.what + ": " + one.why);
    label = "";
  }
  return lines.text();
}

std::string statusJson(const ServiceStatus& status) {
  const TopService& service = status.service;
  const auto started =
      service.uptimeSeconds ? std::optional(status.now - *service.uptimeSeconds) : std::nullopt;
  return harmlessJson(
      std::string("{\"running\":") + (service.isConnected ? "true" : "false") + ",\"problem\":" +
      tools::quoted(service.problem) + ",\"tool_version\":" + tools::quoted(status.version) +
      ",\"started\":" + orNull(started) + ",\"uptime_seconds\":" + orNull(service.uptimeSeconds) +
      ",\"process\":" + (status.process ? std::to_string(*status.process) : "null") +
      ",\"clients\":" + orNull(service.clients) + ",\"sessions\":" + orNull(service.sessions) +
      ",\"mean_messages_per_second\":" + orNull(service.messagesPerSecond) +
      ",\"mean_stored_per_second\":" + orNull(service.storedPerSecond) +
      ",\"waiting_jobs\":" + orNull(service.waitingJobs) +
      ",\"waiting_records\":" + orNull(service.waitingRecords) + ",\"cost\":" + costJson(status) +
      ",\"losses\":" + lossesJson(status.losses) + ",\"places\":" + placesJson(status.places) +
      ",\"disk\":" + diskJson(status) + ",\"off\":" + offJson(status.off) + "}");
}

}  // namespace halvox::tools
