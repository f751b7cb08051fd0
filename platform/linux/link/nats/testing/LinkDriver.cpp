// Drives the NATS back-end with the real dispatch service, as sessions would. Reads one command a
// line and answers each with one line. The configuration is the one that $HALVOX_CONFIG names.
//
//   start FIRST COUNT BATCH SERVICE   makes sessions and starts their discovery: "started"
//   found ID       waits for the discovery of a session: "servers MILLISECONDS [URLS]", or "none …"
//   send ID COUNT FROM   sends numbered messages: "sent TAKEN REFUSED LAST-ERROR"
//   flush ID       "flushed MILLISECONDS"
//   one SERVICE    sends a message outside any session: "sent 1 0", or "sent 0 1 ERROR"
//   threads        "threads COUNT"
//   acknowledged   "acknowledged COUNT", of all messages so far
//   end            closes the back-end, sends one message too late and prints the counters,
//                  "counted VALUE NAME", and the lines of the log, "log LINE"; then "ended"
#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <map>
#include <mutex>
#include <optional>
#include <sstream>
#include <string>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"
#include "platform/linux/runtime/CounterStatisticsService.h"

namespace {

using namespace halvox::platform;
using namespace halvox::platform::linux_;
using Clock = std::chrono::steady_clock;

// An event that another thread announces with a text. Measures the time until the announcement.
class Announcement {
 public:
  void announce(std::string text) {
    const std::lock_guard lock(mutex_);
    text_ = std::move(text);
    ended_ = Clock::now();
    condition_.notify_all();
  }
  std::string wait() {
    std::unique_lock lock(mutex_);
    if (!condition_.wait_for(lock, std::chrono::seconds(60),
                             [this] { return text_.has_value(); })) {
      return "nothing";
    }
    std::istringstream words(*text_);
    std::string first;
    std::string rest;
    words >> first;
    std::getline(words, rest);
    const auto time = std::chrono::duration_cast<std::chrono::milliseconds>(ended_ - began_);
    return first + " " + std::to_string(time.count()) + rest;
  }

 private:
  std::mutex mutex_;
  std::condition_variable condition_;
  std::optional<std::string> text_;
  const Clock::time_point began_ = Clock::now();
  Clock::time_point ended_;
};

struct DrivenSession {
  TLMReportingService::Session session;
  std::shared_ptr<Announcement> found = std::make_shared<Announcement>();
};

class Driver {
 public:
  Driver(TLMReportingService& link, StatisticsService& statistics)
      : link_(link), acknowledged_(statistics.counter("link to NATS", "acknowledged")) {}

  std::string start(std::istream& words) {
    std::int64_t first = 0;
    std::int64_t count = 0;
    bool batch = false;
    std::string service;
    words >> first >> count >> batch >> service;
    for (std::int64_t id = first; id < first + count; ++id) {
      DrivenSession& driven = sessions_[id];
      driven = DrivenSession();
      driven.session =
          link_.TLMReportingCreateSession({{kTLMReportingSessionInfoClientType, 19},
                                           {kTLMReportingSessionInfoSessionID, id},
                                           {kTLMReportingSessionInfoBatchEvent, batch}},
                                          {{kTLMReportingUserInfoServiceName, service}});
      link_.TLMReportingStartConfiguration(
          driven.session, [found = driven.found](const std::optional<Array>& servers) {
            found->announce(servers ? "servers " + describe(Value(*servers)) : "none");
          });
    }
    return "started";
  }

  std::string found(std::istream& words) { return sessionOf(words).found->wait(); }

  std::string send(std::istream& words) {
    const DrivenSession& driven = sessionOf(words);
    std::int64_t count = 0;
    std::int64_t from = 0;
    words >> count >> from;
    std::int64_t taken = 0;
    std::string error;
    for (std::int64_t number = from; number < from + count; ++number) {
      const Dictionary payload{{"number", number}, {"text", std::string(200, 'x')}};
      const TLMReportingOutcome outcome =
          link_.TLMReportingSendMessage(driven.session, {4, 1, payload});
      if (outcome.sent) ++taken;
      if (outcome.error) error = outcome.error->description;
    }
    return "sent " + std::to_string(taken) + " " + std::to_string(count - taken) + " " + error;
  }

  std::string flush(std::istream& words) {
    const auto flushed = std::make_shared<Announcement>();
    link_.TLMReportingFlushMessages(sessionOf(words).session,
                                    [flushed] { flushed->announce("flushed"); });
    return flushed->wait();
  }

  std::string sendOne(std::istream& words) {
    std::string service;
    words >> service;
    const Dictionary payload{{"number", 0}};
    const TLMReportingOutcome outcome = link_.TLMReportingSendOneMessage(
        {{kTLMReportingSessionInfoSessionID, -1}}, {{kTLMReportingUserInfoServiceName, service}},
        {4, 1, payload});
    return outcome.sent ? "sent 1 0" : "sent 0 1 " + outcome.error.value_or(Error{}).description;
  }

  std::string acknowledged() { return "acknowledged " + std::to_string(acknowledged_.value()); }

  static std::string threads() {
    const std::filesystem::directory_iterator tasks("/proc/self/task");
    return "threads " + std::to_string(std::distance(begin(tasks), end(tasks)));
  }

 private:
  DrivenSession& sessionOf(std::istream& words) {
    std::int64_t id = 0;
    words >> id;
    return sessions_[id];
  }

  TLMReportingService& link_;
  Counter& acknowledged_;
  std::map<std::int64_t, DrivenSession> sessions_;
};

std::string answer(Driver& driver, const std::string& command, std::istream& words) {
  if (command == "start") return driver.start(words);
  if (command == "found") return driver.found(words);
  if (command == "send") return driver.send(words);
  if (command == "flush") return driver.flush(words);
  if (command == "one") return driver.sendOne(words);
  if (command == "acknowledged") return driver.acknowledged();
  if (command == "threads") return Driver::threads();
  return "what? " + command;
}

int drive(const Configuration& configuration) {
  FakePlatform neighbours;
  CounterStatisticsService statistics;
  AsioDispatchService dispatch(neighbours.log, statistics);
  const auto link = makeNatsTlmReporting(configuration.link, {dispatch, statistics});
  {
    Driver driver(*link, statistics);
    for (std::string line; std::getline(std::cin, line) && line != "end";) {
      std::istringstream words(line);
      std::string command;
      words >> command;
      std::cout << answer(driver, command, words) << std::endl;
    }
  }
  static_cast<void>(dispatch.stop(std::chrono::seconds(5)));
  const bool isAllEnded = link->close();
  const TLMReportingOutcome late = link->TLMReportingSendOneMessage({}, {}, {4, 1, {}});
  if (late.sent) std::cout << "log a message was taken after the end\n";
  for (const CounterReading& reading : statistics.snapshot()) {
    if (reading.piece == "link to NATS") {
      std::cout << "counted " << reading.value << " " << reading.name << "\n";
    }
  }
  for (const auto& line : neighbours.log.lines()) std::cout << "log " << line.text << "\n";
  std::cout << "ended" << std::endl;
  if (!isAllEnded) std::quick_exit(EXIT_SUCCESS);
  return EXIT_SUCCESS;
}

}  // namespace

int main() {
  const auto loaded = loadConfiguration();
  if (!loaded) {
    std::cerr << loaded.error().message << std::endl;
    return EXIT_FAILURE;
  }
  return drive(*loaded);
}
