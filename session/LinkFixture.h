#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"

// Shared by the tests of the real-time link.
namespace halvox::link_test {

using platform::Array;
using platform::Dictionary;
using platform::JournalKind;
using platform::LogLevel;
using Fake = platform::FakeTlmReportingService;
using Line = std::pair<LogLevel, std::string>;

inline constexpr auto kPlayback = AudioEventCategory::kPlayback;
inline constexpr auto kStart = AudioEventType::kStart;
inline const Array kServers{"server 1", "server 2"};

inline const Line kStartEntered{LogLevel::kDebug,
                                "entering tlmreporting -[HVReportingSession start]_block_invoke"};
inline const Line kStopEntered{LogLevel::kDebug,
                               "entering tlmreporting -[HVReportingSession stop]_block_invoke"};
inline const Line kClosed{LogLevel::kDebug, "stopping and setting session to nil"};
inline const Line kWaiting{LogLevel::kDefault, "waiting to find backends"};
inline const Line kTimedOut{LogLevel::kDefault, "timed out waiting for backends"};
inline const Line kList{LogLevel::kDefault, "list of backends (server 1, server 2)"};
inline const Line kContinuing{LogLevel::kDefault, "continuing with backends!"};
inline const Line kNone{LogLevel::kError,
                        "no backends found, this session won't get sent to the server"};
inline const Line kFailed{LogLevel::kDefault, "failed to find backend"};
inline const std::string kMessageEntered =
    "entering tlmreporting "
    "-[HVReportingSession sendMessage:category:type:sync:reply:]_block_invoke";

// A session with the link enabled, not started yet. Submitted jobs run when a test calls run(), and
// before start(), stop() and open() return.
class LinkFixture : public testing::Test {
 protected:
  LinkFixture() {
    session_->setServiceType(AudioServiceType::kHaptics);
    session_->setTlmReportingEnabled(true);
  }

  void run() { platform_.dispatch.runUntilIdle(); }
  void start() {
    session_->start();
    run();
  }
  void stop() {
    session_->stop();
    run();
  }
  // From now on a discovery waits until the test answers it.
  void holdDiscoveries() { framework_.answerDiscoveries(Fake::Answering::kWhenTold); }
  void open() {
    framework_.answerDiscoveries(Fake::Answering::kLater, kServers);
    start();
  }
  void send(const Dictionary& message, AudioEventCategory category = kPlayback,
            AudioEventType type = kStart) {
    session_->sendMessage(message, category, type, nullptr);
  }
  // The lines of the link's log since the last call.
  std::vector<Line> linkLines() {
    std::vector<Line> result;
    for (const auto& line : platform_.log.lines()) {
      if (line.category == "hvri") result.emplace_back(line.level, line.text);
    }
    platform_.log.clear();
    return result;
  }
  std::vector<std::string> frameworkSteps() const {
    return platform_.journal.texts(JournalKind::kLink);
  }
  std::vector<Dictionary> payloads() const {
    std::vector<Dictionary> result;
    for (const auto& message : framework_.messages()) result.push_back(message.payload);
    return result;
  }
  // True if the link is closed and released.
  bool holdsNothing() const {
    return session_->link().tlmReportingSession() == nullptr &&
           session_->link().tlmReportingAgentToken() == nullptr;
  }

  platform::FakePlatform platform_;
  Fake& framework_ = platform_.tlmReporting;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(platform_.statistics));
};

}  // namespace halvox::link_test
