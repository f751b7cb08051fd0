#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "analysis/MessageNames.h"
#include "analysis/RecordSource.h"

namespace halvox::analysis {

// Records as the service stores them, made by hand: each message becomes two events with equal
// payloads and, unless it repeats another or there is no link, a link message. The service of these
// records started 100 seconds after the machine.
class RecordSeries final : public RecordSource {
 public:
  struct Sender {
    std::string application = "player";
    std::string service = "longformaudio";
    std::optional<std::int64_t> sessionID = 7;  // without one, the link has no record
    std::optional<std::int64_t> serial{};       // object_serial
  };

  // Sets the time of what follows, in seconds since 1970. The clocks of the machine go on with it.
  RecordSeries& at(double time) {
    uptime_ += time - time_;
    time_ = time;
    return *this;
  }
  // Sets the clock, which the machine's uptime does not follow.
  void setClock(double time) { time_ = time; }
  // The service ends and starts anew, `ago` seconds before now.
  void restartService(double ago = 0.5) { processStart_ = uptime_ - ago; }

  // Adds the records of one message. `members` are the members of its payload, as JSON.
  void message(const Sender& sender, const std::string& category, const std::string& type,
               const std::string& members = "") {
    event(sender, category, type, members);
    if (sender.sessionID) link(sender, category, type, members);
  }
  // Adds only the events of a message.
  void event(const Sender& sender, const std::string& category, const std::string& type,
             const std::string& members = "") {
    const std::string payload =
        stamped(sender, members) + ",\"HostApplicationDisplayID\":\"" + sender.application + "\"}";
    for (const std::string& service : {std::string(kCommonService), sender.service}) {
      Stored& stored = add(RecordKind::kEvent, payload);
      stored.name = "com.tarno." + service + "." + category + "." + type;
      stored.application = sender.application;
    }
  }
  // Adds only the link message.
  void link(const Sender& sender, const std::string& category, const std::string& type,
            const std::string& members = "") {
    Stored& stored = add(RecordKind::kLinkMessage, stamped(sender, members) + "}");
    stored.service = sender.service;
    stored.category = category;
    stored.type = type;
    stored.sessionID = sender.sessionID.value_or(-1);
  }
  // Adds the summary that a stop sends through the link.
  void summary(const Sender& sender, const std::string& stamps = "1,2") {
    Stored& stored =
        add(RecordKind::kLinkMessage,
            R"({"HV_Session_Summary_Event":"7","hvreporting_timestamp":")" + stamps + "\"}");
    stored.service = sender.service;
    stored.category = "Undefined";
    stored.type = "Unknown";
    stored.sessionID = sender.sessionID.value_or(-1);
  }
  void clientGone(const std::string& process) {
    add(RecordKind::kEvent, "{\"processName\":\"" + process + "\",\"seconds\":5}").name =
        "com.tarno.halvox.hvreportingclientuptime";
  }

  platform::linux_::Result<void> forEach(const RecordRange& range,
                                         const Callback& callback) override {
    Payload payload;
    for (const Stored& stored : records_) {
      if (range.since && stored.time < *range.since) continue;
      if (range.until && stored.time >= *range.until) continue;
      callback(show(stored, payload));
    }
    return {};
  }

 private:
  struct Stored {
    RecordKind kind{};
    std::int64_t id = 0;
    double time = 0;
    std::string name{};
    std::string service{};
    std::string category{};
    std::string type{};
    std::string application{};
    std::optional<std::int64_t> sessionID{};
    std::string payload{};
  };

  Stored& add(RecordKind kind, std::string payload) {
    const auto id = static_cast<std::int64_t>(records_.size()) + 1;
    records_.push_back({.kind = kind, .id = id, .time = time_, .payload = std::move(payload)});
    return records_.back();
  }

  [[nodiscard]] std::string stamped(const Sender& sender, const std::string& members) const {
    std::string payload = "{" + members + (members.empty() ? "" : ",");
    if (sender.serial) payload += "\"object_serial\":" + std::to_string(*sender.serial) + ",";
    const auto process = static_cast<std::int64_t>((uptime_ - processStart_) * 1000);
    payload += "\"hvreporting_timestamp\":" + std::to_string(time_) +
               ",\"systemuptime_sec\":" + std::to_string(static_cast<std::int64_t>(uptime_ + 0.5)) +
               ",\"processuptime_ms\":" + std::to_string(process);
    return payload;
  }

  static Record show(const Stored& stored, Payload& payload) {
    payload.show(stored.payload);
    Record record;
    record.kind = stored.kind;
    record.id = stored.id;
    record.time = stored.time;
    record.name = stored.name;
    record.service = stored.service;
    record.category = stored.category;
    record.type = stored.type;
    if (stored.kind == RecordKind::kEvent) {
      const EventNameParts parts = splitEventName(stored.name);
      record.service = parts.service;
      record.category = parts.category;
      record.type = parts.type;
    }
    record.application = stored.application;
    record.sessionID = stored.sessionID;
    record.payload = &payload;
    return record;
  }

  std::vector<Stored> records_;
  double time_ = 1'000'000;
  double uptime_ = 200;
  double processStart_ = 100;
};

}  // namespace halvox::analysis
