#include "backends/HVReportingUtilityVEKStateManager.h"

#include <string>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::LogLevel;
using platform::Message;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr auto kSession = AudioEventCategory::kSession | AudioEventCategory::kGeneric;
const Dictionary& reportA() {
  static const Dictionary report{{"Haptic_Active_Hardware_Time_Seconds", 30}};
  return report;
}
const Dictionary& reportB() {
  static const Dictionary report{{"Haptic_Active_Hardware_Time_Seconds", 31}};
  return report;
}

class HVReportingUtilityVEKStateManagerTest : public testing::Test {
 protected:
  HVReportingUtilityVEKStateManagerTest() {
    session_->setServiceType(AudioServiceType::kHaptics);
    platform_.log.clear();
  }

  void handle(const Message& message, AudioEventType type = AudioEventType::kJoulebook,
              std::optional<std::string_view> processName = "player") {
    manager_.handleEvent(message, kSession, type, session_, processName);
  }
  std::size_t snapshots() const { return platform_.diagnosticReporters.requests().size(); }
  void expectNothingCounted() const {
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 0U);
    EXPECT_TRUE(manager_.messageCache().empty());
  }

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(platform_.statistics));
  HVReportingUtilityVEKStateManager manager_{platform_.statistics};
};

TEST_F(HVReportingUtilityVEKStateManagerTest, BeginsWithNothing) {
  expectNothingCounted();
  EXPECT_EQ(manager_.ailmentReporter(), nullptr);
}

TEST_F(HVReportingUtilityVEKStateManagerTest, TheFirstReportIsCountedAndRemembered) {
  handle(reportA());

  EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1U);
  EXPECT_EQ(manager_.messageCache(), reportA());
  EXPECT_EQ(snapshots(), 0U);
  ASSERT_EQ(platform_.log.lines().size(), 1U);
  EXPECT_EQ(platform_.log.lines(LogLevel::kInfo).front().text, "Incrementing VEK counter. player");
  EXPECT_EQ(platform_.log.lines().front().category, "hvrb");
}

TEST_F(HVReportingUtilityVEKStateManagerTest, ARepeatOfTheCountedReportIsIgnored) {
  handle(reportA());
  platform_.log.clear();

  handle(Dictionary{{"Haptic_Active_Hardware_Time_Seconds", 30.0}});  // equal, but another object

  EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1U);
  EXPECT_EQ(manager_.messageCache(), reportA());
  EXPECT_EQ(snapshots(), 0U);
  EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HVReportingUtilityVEKStateManagerTest, TheSecondDistinctReportBringsASnapshot) {
  handle(reportA(), AudioEventType::kJoulebook, "first");
  platform_.log.clear();

  handle(reportB(), AudioEventType::kJoulebook, "second");

  ASSERT_EQ(snapshots(), 1U);
  const auto request = platform_.diagnosticReporters.requests().front();
  EXPECT_EQ(request.signature, (Dictionary{{"domain", "Acoustat"},
                                           {"type", "haptics"},
                                           {"subType", "Session_Generic"},
                                           {"subtypeContext", "Joulebook"},
                                           {"detectedProcess", "second"}}));
  EXPECT_EQ(request.durationSeconds, 0.0);
  EXPECT_EQ(request.event, std::nullopt);
  EXPECT_EQ(request.payload, std::nullopt);
  EXPECT_EQ(request.reporter, manager_.ailmentReporter().get());
  expectNothingCounted();
  EXPECT_THAT(platform_.log.texts(LogLevel::kInfo),
              ElementsAre("Getting snapshot with Ailment Reporter"));
}

TEST_F(HVReportingUtilityVEKStateManagerTest, TheReportThatBroughtTheSnapshotCountsAgain) {
  handle(reportA());
  handle(reportB());

  handle(reportB());

  EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1U);
  EXPECT_EQ(manager_.messageCache(), reportB());
  EXPECT_EQ(snapshots(), 1U);
}

TEST_F(HVReportingUtilityVEKStateManagerTest, EverySecondDistinctReportBringsASnapshotOfItsOwn) {
  handle(reportA());
  handle(reportB());
  const auto first = manager_.ailmentReporter();
  handle(reportA());
  handle(reportB());

  EXPECT_EQ(snapshots(), 2U);
  EXPECT_EQ(platform_.diagnosticReporters.reportersMade(), 2U);
  EXPECT_NE(manager_.ailmentReporter(), first);
  EXPECT_EQ(first.use_count(), 1);  // the manager released it
}

TEST_F(HVReportingUtilityVEKStateManagerTest, MessagesThatReportNoLeakDoNothing) {
  handle(Dictionary{{"EngineOnTime", 4}});
  handle(Dictionary{});
  handle(std::nullopt);
  handle(reportA(), AudioEventType::kIssueDetector);
  handle(reportB(), AudioEventType::kUnknown);

  expectNothingCounted();
  EXPECT_EQ(snapshots(), 0U);
  EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HVReportingUtilityVEKStateManagerTest, MessagesThatReportNoLeakKeepWhatWasCounted) {
  handle(reportA());
  handle(Dictionary{{"EngineOnTime", 4}});
  handle(reportB(), AudioEventType::kError);

  EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1U);
  EXPECT_EQ(manager_.messageCache(), reportA());
}

TEST_F(HVReportingUtilityVEKStateManagerTest, TheReplyIsOnlyLogged) {
  handle(reportA());
  handle(reportB());
  platform_.log.clear();

  platform_.diagnosticReporters.reply(0, {{"path", "x"}});

  EXPECT_THAT(platform_.log.texts(LogLevel::kInfo),
              ElementsAre("Response from ailmentReporter : " +
                          platform::describe(Dictionary{{"path", "x"}})));
  expectNothingCounted();
}

TEST_F(HVReportingUtilityVEKStateManagerTest, TheReplyMayComeAfterTheManagerIsDestroyed) {
  {
    HVReportingUtilityVEKStateManager brief(platform_.statistics);
    brief.handleEvent(reportA(), kSession, AudioEventType::kJoulebook, session_, "player");
    brief.handleEvent(reportB(), kSession, AudioEventType::kJoulebook, session_, "player");
  }
  platform_.log.clear();

  std::thread([this] { platform_.diagnosticReporters.reply(0, {}); }).join();

  EXPECT_EQ(platform_.log.lines().size(), 1U);
}

TEST_F(HVReportingUtilityVEKStateManagerTest, TheSnapshotComesAtACountOfExactlyOne) {
  manager_.setLeakedHapticsSessionCounter(2);

  handle(reportA());

  EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 3U);
  EXPECT_EQ(snapshots(), 0U);
}

TEST_F(HVReportingUtilityVEKStateManagerTest, ChangingTheSentReportDoesNotChangeTheRememberedOne) {
  Message message = reportA();
  handle(message);
  message->set("more", 1);

  EXPECT_EQ(manager_.messageCache(), reportA());
}

TEST_F(HVReportingUtilityVEKStateManagerTest, ReportsAreCountedAndTheCountsBalance) {
  handle(reportA());
  handle(reportA());
  handle(reportB());
  handle(Dictionary{{"EngineOnTime", 4}});

  const auto value = [this](std::string_view name) {
    return platform_.statistics.value("bug capture bridge", name);
  };
  EXPECT_EQ(value("received"), 3U);
  EXPECT_EQ(value("delivered"), 1U);
  EXPECT_EQ(value("suppressed: first of two"), 1U);
  EXPECT_EQ(value("suppressed: repeated"), 1U);
}

TEST_F(HVReportingUtilityVEKStateManagerTest, EachPropertyMayBeReadWhileReportsCome) {
  std::thread reader([this] {
    for (int count = 0; count < 1000; ++count) {
      static_cast<void>(manager_.leakedHapticsSessionCounter());
      static_cast<void>(manager_.ailmentReporter());
      static_cast<void>(manager_.messageCache());
    }
  });
  for (int count = 0; count < 100; ++count) {
    handle(Dictionary{{"Haptic_Active_Hardware_Time_Seconds", count}});
  }
  reader.join();

  EXPECT_EQ(snapshots(), 50U);
}

}  // namespace
}  // namespace halvox
