// Fills a new store as a day with many streams does, for measurements of the programs that read it:
//   halvox_report_store DIRECTORY [EVENTS]
// Each message makes two events and a link message. One in fifty is an xrun, which also makes an
// issue metric; starts and stops make power events. bench/report/report_cost.py runs this program.

#include <array>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <random>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "bench/TypicalMessage.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/store/SqliteAnalyticsService.h"
#include "platform/linux/store/SqliteStore.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::int64_t kEvents = 1'000'000;
constexpr int kStreamsAtOnce = 8;
constexpr int kMessagesPerStream = 200;
constexpr double kPeriod = 24 * 60 * 60;  // seconds
constexpr double kBootTime = 3600;        // seconds before the first message
constexpr std::uint32_t kAudioIssueDetected = 0x5B0003;

// The time of the records, which the main thread sets and the store's writer reads.
class RecordClock final : public ClockService {
 public:
  explicit RecordClock(double time) : time_(time) {}
  // Relaxed, because no other data depends on the time.
  void set(double time) { time_.store(time, std::memory_order_relaxed); }
  [[nodiscard]] Date currentDate() const override {
    return {time_.load(std::memory_order_relaxed)};
  }
  [[nodiscard]] LocalTime localTime(Date /*date*/) const override { return {}; }
  [[nodiscard]] std::chrono::duration<double> systemUptime() const override { return {}; }
  [[nodiscard]] std::chrono::milliseconds processUptime() const override { return {}; }

 private:
  std::atomic<double> time_;
};

// What a message is: its category and type as numbers, as a link message has them, and by name.
struct Kind {
  std::uint16_t category;
  std::uint16_t type;
  std::string_view categoryName;
  std::string_view typeName;
};
constexpr Kind kSetup{8, 5, "Session_Setup", "Setup"};
constexpr Kind kRoute{10, 18, "Session_RouteChange", "State"};
constexpr Kind kVolume{14, 18, "Session_Volume", "State"};
constexpr Kind kStart{4, 1, "Session_Playback", "Start"};
constexpr Kind kStop{4, 2, "Session_Playback", "Stop"};
constexpr Kind kIssue{4, 7, "Session_Playback", "IssueDetector"};
constexpr Kind kState{4, 18, "Session_Playback", "State"};
constexpr std::string_view kTimes = "com.tarno.halvox.IOReporting.Histogram";

// A field of a protocol buffer.
void addField(std::vector<std::byte>& bytes, unsigned number, std::string_view text) {
  constexpr unsigned kLengthDelimited = 2;
  bytes.push_back(static_cast<std::byte>(number << 3U | kLengthDelimited));
  bytes.push_back(static_cast<std::byte>(text.size()));
  for (const char letter : text) bytes.push_back(static_cast<std::byte>(letter));
}

class Day {
 public:
  Day(SqliteStore& store, RecordClock& clock, std::int64_t messages)
      : store_(store),
        clock_(clock),
        first_(clock.currentDate().secondsSince1970),
        step_(kPeriod / static_cast<double>(messages)),
        messages_(messages) {}

  void write() {
    std::array<Stream, static_cast<std::size_t>(kStreamsAtOnce)> streams;
    // They begin and end one after the other.
    int sent = 0;
    for (Stream& stream : streams) {
      begin(stream);
      stream.sent = std::exchange(sent, sent + kMessagesPerStream / kStreamsAtOnce);
    }
    for (sent_ = 0; sent_ < messages_; ++sent_) {
      clock_.set(first_ + step_ * static_cast<double>(sent_));
      Stream& stream = streams[static_cast<std::size_t>(sent_) % streams.size()];
      sendNext(stream);
      if (++stream.sent == kMessagesPerStream) {
        end(stream);
        begin(stream);
      }
    }
  }

 private:
  struct Stream {
    std::shared_ptr<const LinkParty> party;
    std::string application;
    std::string device;
    std::string service;
    int sent = 0;
  };

  void begin(Stream& stream) {
    constexpr std::int64_t kApplications = 200;
    constexpr std::int64_t kDevices = 12;
    const std::int64_t number = ++streams_;
    stream.application = "org.example.player-" + std::to_string(number * 37 % kApplications);
    stream.device = "Speakers " + std::to_string(number % kDevices);
    stream.service = number % 3 == 0 ? "system" : "longformaudio";
    stream.party = std::make_shared<LinkParty>(
        LinkParty{number, "com.tarno.halvox", stream.service + "_session"});
    stream.sent = 0;
  }

  void sendNext(const Stream& stream) {
    Dictionary message;
    message.reserve(16);
    switch (stream.sent) {
      case 0:
        message.set("session_selected_format", "F32LE 48000 Hz 2 ch");
        return send(stream, kSetup, std::move(message));
      case 1:
        message.set("active_devices", stream.device);
        return send(stream, kRoute, std::move(message));
      case 2:
        power(stream, "start");
        message.set("run", std::int64_t{1});
        return send(stream, kStart, std::move(message));
      case kMessagesPerStream - 1:
        power(stream, "stop");
        message.set("run", std::int64_t{1});
        return send(stream, kStop, std::move(message));
      default:
        return sendRunning(stream);
    }
  }

  void sendRunning(const Stream& stream) {
    constexpr unsigned long kXrunsOf = 50;
    constexpr unsigned long kVolumesOf = 10;
    constexpr unsigned long kRoutesOf = 100;
    const unsigned long lot = random_() % (kXrunsOf * kVolumesOf * kRoutesOf);
    if (lot % kXrunsOf == 0) return sendXrun(stream);
    if (lot % kVolumesOf == 1) {
      Dictionary message;
      message.set("RQSessionVolume", 0.05 * static_cast<double>(random_() % 20));
      message.set("RQSessionVolumePlayingState", std::int64_t{1});
      return send(stream, kVolume, std::move(message));
    }
    if (lot % kRoutesOf == 2) {
      Dictionary message;
      message.set("active_devices", random_() % 2 == 0 ? "Headset" : stream.device);
      return send(stream, kRoute, std::move(message));
    }
    send(stream, kState, bench::makeMessage(512 * sent_));
  }

  void sendXrun(const Stream& stream) {
    const auto cycles = static_cast<std::int64_t>(1 + random_() % 5);
    const double milliseconds = 21.333 * static_cast<double>(cycles);
    Dictionary message;
    message.reserve(16);
    message.set("issue_type", "xrun");
    message.set("node", stream.application);
    message.set("rtaid_client", stream.application);
    message.set("any_channel_silence_seconds", milliseconds / 1000);
    message.set("xrun_milliseconds", milliseconds);
    message.set("missed_cycles", cycles);
    message.set("quantum", std::int64_t{1024});
    message.set("rate", std::int64_t{48'000});
    message.set("xrun_role", cycles % 2 == 0 ? "culprit" : "victim");
    message.set("device_node_name", stream.device);
    message.set("late_node", stream.application);
    IssueMetricRecord metric{.time = clock_.currentDate().secondsSince1970,
                             .metricID = kAudioIssueDetected};
    addField(metric.message, 3, "xrun");
    addField(metric.message, 4, stream.device);
    addField(metric.message, 5, stream.application);
    store_.issueMetrics().add(std::move(metric));
    send(stream, kIssue, std::move(message));
  }

  void send(const Stream& stream, const Kind& kind, Dictionary message) {
    const double time = stamp(message);
    for (const std::string_view service :
         {std::string_view("halvox"), std::string_view(stream.service)}) {
      std::string name("com.tarno.");
      name.append(service).append(".").append(kind.categoryName).append(".").append(kind.typeName);
      sendEvent(name, message, stream.application);
    }
    message.set("audiotag", std::string(kind.categoryName).append(kind.typeName));
    store_.linkMessages().add({.time = time,
                               .party = stream.party,
                               .category = kind.category,
                               .type = kind.type,
                               .payload = std::move(message)});
  }

  // What the service adds to each message. Returns its time.
  double stamp(Dictionary& message) const {
    const double time = clock_.currentDate().secondsSince1970;
    const double running = time - first_;
    message.set("hvreporting_timestamp", time);
    message.set("systemuptime_sec", static_cast<std::int64_t>(kBootTime + running));
    message.set("processuptime_ms", static_cast<std::int64_t>(1000 * running));
    return time;
  }

  void sendEvent(const std::string& name, const Dictionary& message,
                 const std::string& application) {
    service_.sendAnalyticsEventLazy(name, [message, application] {
      static const Key key("HostApplicationDisplayID");
      return AnalyticsPayload(message, {key, application});
    });
  }

  void power(const Stream& stream, const char* state) {
    constexpr std::uint32_t kAudio = 28;
    Dictionary payload{{"ApplicationName", stream.application}, {"state", state}};
    store_.powerEvents().add({.time = clock_.currentDate().secondsSince1970,
                              .categoryID = kAudio,
                              .eventName = "AudioSession",
                              .payload = std::move(payload)});
  }

  // What the drivers counted, and the session's summary.
  void end(const Stream& stream) {
    Dictionary times{{"Speakers_Histogram_busytime",
                      "unit=us::0-100:90;100-200:" + std::to_string(random_() % 100) +
                          ";200-9223372036854775807:1"}};
    stamp(times);
    sendEvent(std::string(kTimes), times, stream.application);
    Dictionary summary{{"HV_Session_Summary_Event", "7"}};
    const double time = stamp(summary);
    store_.linkMessages().add({.time = time,
                               .party = stream.party,
                               .category = 0,
                               .type = 0,
                               .payload = std::move(summary)});
  }

  SqliteStore& store_;
  RecordClock& clock_;
  SqliteAnalyticsService service_{store_, clock_};
  const double first_;
  const double step_;  // seconds between two messages
  const std::int64_t messages_;
  std::int64_t sent_ = 0;
  std::int64_t streams_ = 0;
  std::minstd_rand random_;  // the same store each time, but for its times
};

int run(const char* directory, std::int64_t events) {
  const auto now = std::chrono::system_clock::now().time_since_epoch();
  RecordClock clock(std::chrono::duration<double>(now).count() - kPeriod);
  CounterStatisticsService statistics;
  Backpressure backpressure;
  SqliteStore store(StoreOptions{.directory = directory, .maxMegabytes = 4096},
                    SqliteStore::Environment{clock, statistics, backpressure});
  if (const auto opened = store.open(); !opened) {
    std::cerr << opened.error().message << '\n';
    return EXIT_FAILURE;
  }
  Day(store, clock, events / 2).write();
  return EXIT_SUCCESS;
}

}  // namespace
}  // namespace halvox::platform::linux_

int main(int argumentCount, char** arguments) {
  if (argumentCount < 2 || argumentCount > 3) {
    std::cerr << "usage: halvox_report_store DIRECTORY [EVENTS]\n";
    return EXIT_FAILURE;
  }
  const std::int64_t events =
      argumentCount == 3 ? std::atoll(arguments[2]) : halvox::platform::linux_::kEvents;
  return halvox::platform::linux_::run(arguments[1], events);
}
