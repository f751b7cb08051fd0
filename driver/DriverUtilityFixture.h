#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "driver/HVReportingDriverUtility.h"
#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"
#include "session/HistoryFixture.h"

namespace halvox {
// Shared by the tests of the sampler.
namespace driver_testing {

using platform::Dictionary;
using platform::LogLevel;
using Channel = platform::FakeIOReportService::Channel;
using Texts = std::vector<std::string>;

// The descriptions of all groups, in the order of their reports.
inline constexpr const char* kGroups[] = {"TarnoQ7AMP-(null)",
                                          "Speaker-(null)",
                                          "(null)-MCA",
                                          "Haptics-Stats",
                                          "StateTransitionTimes_ms-(null)",
                                          "Rx-(null)",
                                          "Tx-(null)",
                                          "(null)-IOSndFam2"};

inline Channel simpleChannel(std::string name, std::int64_t value) {
  return {.driverName = "Amp<1>",
          .group = "Speaker",
          .channelName = std::move(name),
          .integerValue = value};
}

// Has a session that is started, and no channels yet.
class DriverUtilityFixture : public testing::Test {
 protected:
  DriverUtilityFixture() {
    session_->setServiceType(AudioServiceType::kHaptics);
    session_->start();
    forgetWhatHappened();
  }

  // A sampler of the groups that exist now, as the service makes it when it starts.
  HVReportingDriverUtility makeUtility() {
    HVReportingDriverUtility utility;
    forgetWhatHappened();
    return utility;
  }
  void forgetWhatHappened() {
    platform_.journal.clear();
    platform_.log.clear();
    platform_.analytics.clear();
  }
  // The log lines of the driver statistics.
  Texts lines(LogLevel level) const {
    Texts texts;
    for (const auto& line : platform_.log.lines(level)) {
      if (line.category == "hvrd") texts.push_back(line.text);
    }
    return texts;
  }
  // The messages that the session recorded.
  std::vector<Dictionary> recorded() const {
    std::vector<Dictionary> messages;
    const auto history = session_->nestedAggregatedPayloadData();
    for (RecordedMessage& entry : messagesOf(**history)) {
      messages.push_back(std::move(entry.message));
    }
    return messages;
  }

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(platform_.statistics));
};

}  // namespace driver_testing
}  // namespace halvox
