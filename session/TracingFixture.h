#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"
#include "session/TraceConstants.h"

// A test session with the tracing feature enabled, not started yet.
namespace halvox::tracing_test {

using platform::Array;
using platform::Dictionary;
using platform::Error;
using platform::JournalKind;
using platform::LogLevel;
using platform::Value;
using Texts = std::vector<std::string>;

inline constexpr const char* kFile = "/params.plist";

class TracingFixture : public testing::Test {
 protected:
  TracingFixture() {
    platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOn);
    platform_.propertyLists.setFile(
        kFile, Dictionary{{"Children", Array{Dictionary{{"Name", "T"}, {"Children", Array{}}}}}});
    session_->setServiceType(AudioServiceType::kTest);
    forgetWhatHappened();
  }
  void forgetWhatHappened() {
    platform_.journal.clear();
    platform_.log.clear();
  }
  void chooseRunner() {
    session_->setConfiguration(Dictionary{{HVReportingTraceType, HVReportingTraceTypeKtrace},
                                          {HVReportingMeridelPlistFilePath, kFile}});
  }
  void chooseFramework() {
    session_->setConfiguration(Dictionary{{HVReportingTraceType, HVReportingTraceTypeArtrace}});
  }
  static Dictionary paramsOf(const char* name, const char* begin, const char* end) {
    const Dictionary point{{"Name", name},
                           {"Type", "Interval"},
                           {"KTraceCodeBegin", begin},
                           {"KTraceCodeEnd", end},
                           {"EventsMatchedBy", "Thread"}};
    return {{"Children", Array{Dictionary{{"Name", "T"}, {"Children", Array{point}}}}}};
  }
  void recordInterval(std::uint64_t begin, std::uint64_t end) {
    platform_.ktrace.setEvents(
        {{.timestamp = begin, .debugid = 0x21040010}, {.timestamp = end, .debugid = 0x21040014}});
  }
  // Runs what the back-ends do on their own queues.
  void letRun() { platform_.dispatch.runUntilIdle(); }
  // The operations that the trace back-ends were asked for.
  Texts operations() const { return platform_.journal.texts(JournalKind::kNote); }
  // The lines of one level and category.
  Texts lines(LogLevel level, std::string_view category) const {
    Texts texts;
    for (const auto& line : platform_.log.lines(level)) {
      if (line.category == category) texts.push_back(line.text);
    }
    return texts;
  }

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(platform_.statistics));
};

}  // namespace halvox::tracing_test
