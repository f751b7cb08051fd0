#include "tools/Records.h"

#include <cstdlib>
#include <ctime>
#include <memory>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "client/testing/TestService.h"
#include "platform/fake/FakePlatform.h"
#include "platform/linux/store/SqliteMetricService.h"
#include "platform/linux/store/SqliteStore.h"
#include "platform/protobuf.h"

namespace halvox::tools {
namespace {

using Kind = ShowRecords::Kind;
using platform::linux_::LinkParty;
using platform::linux_::SqliteMetricService;
using platform::linux_::SqliteStore;
using platform::linux_::StoredRecord;
using ::testing::HasSubstr;
using ::testing::Not;

constexpr std::uint32_t kIssueMetric = 0x5B0003;

// The fields of the issue metric and an unknown one.
class Issue final : public platform::ProtoBase {
 public:
  bool readFrom(platform::ProtoReader& /*reader*/) override { return true; }
  void writeTo(platform::ProtoWriter& writer) const override {
    writer.writeUInt64(70, 1);
    writer.writeInt32(-5, 2);
    writer.writeString("xrun", 3);
    writer.writeString("the node", 4);
    writer.writeString("player", 5);
    writer.writeString("not known", 9);
  }
  void formatText(platform::ProtoTextFormatter& /*formatter*/,
                  const char* /*name*/) const override {}
};

class RecordsTest : public testing::Test {
 protected:
  RecordsTest() {
    setenv("TZ", "UTC", 1);
    tzset();
    platform::linux_::StoreOptions options;
    options.directory = scratch_.path("state");
    options.retentionDays = 1'000'000;  // these records are old
    store_ = std::make_unique<SqliteStore>(
        options, SqliteStore::Environment{platform_.clock, platform_.statistics, backpressure_});
    EXPECT_TRUE(store_->open());
    platform_.clock.setCurrentDate({100});
  }

  void storeLink(double time, std::int64_t session, std::uint16_t category, std::uint16_t type,
                 const std::string& service = "music") {
    store_->linkMessages().add(
        {.time = time,
         .party = std::make_shared<LinkParty>(LinkParty{session, "client", service}),
         .category = category,
         .type = type,
         .payload = {{"a", 1}}});
  }
  // What is printed for the request, from a store that has all that was added.
  std::string shown(ShowRecords request, OutputForm form = OutputForm::kText) {
    EXPECT_TRUE(client::eventually([this] { return store_->waiting() == 0; }));
    request.selection.database = scratch_.path("state");
    std::ostringstream out;
    EXPECT_EQ(showRecords(request, form, out, -1, errors_), ExitStatus::kDone) << errors_.str();
    return out.str();
  }
  std::string shown(Kind kind, OutputForm form = OutputForm::kText) {
    return shown(ShowRecords{kind, {}, {}, {}, {}}, form);
  }

  client::ScratchDirectory scratch_;
  platform::FakePlatform platform_;
  platform::linux_::Backpressure backpressure_;
  std::unique_ptr<SqliteStore> store_;
  std::ostringstream errors_;
};

TEST_F(RecordsTest, IssueMetricsAreShownByTheirFields) {
  SqliteMetricService metrics(*store_, platform_.clock);
  metrics.postIssueMetric(kIssueMetric, Issue());

  EXPECT_EQ(shown(Kind::kMetrics),
            "1970-01-01 00:01:40.000  0x5B0003  issue_type=xrun node=\"the node\" "
            "rtaid_client=player duration=-5 timestamp=70\n");
  EXPECT_THAT(
      shown(Kind::kMetrics, OutputForm::kJson),
      HasSubstr(
          R"("fields":{"issue_type":"xrun","node":"the node",)"
          R"("rtaid_client":"player","duration":-5,"timestamp":70},"cursor":"metrics:1@100"})"));
}

TEST_F(RecordsTest, OtherMetricsAreShownByTheirBytes) {
  SqliteMetricService metrics(*store_, platform_.clock);
  metrics.postIssueMetric(0x7, Issue());

  EXPECT_THAT(shown(Kind::kMetrics), HasSubstr("  0x7  0846"));
  EXPECT_THAT(shown(Kind::kMetrics, OutputForm::kJson), Not(HasSubstr("\"fields\"")));
}

TEST_F(RecordsTest, BytesThatAreNotAnIssueMetricAreShownUnchanged) {
  store_->issueMetrics().add(
      {.time = 100, .metricID = kIssueMetric, .message = {std::byte{0x1A}, std::byte{0x05}}});

  EXPECT_EQ(shown(Kind::kMetrics), "1970-01-01 00:01:40.000  0x5B0003  1a05\n");
  EXPECT_EQ(
      shown(Kind::kMetrics, OutputForm::kJson),
      "{\"time\":100.0,\"metric_id\":5963779,\"message\":\"1a05\",\"cursor\":\"metrics:1@100\"}\n");
}

TEST_F(RecordsTest, PowerEventsAreShownWithCategoryNameAndPayload) {
  store_->powerEvents().add(
      {.time = 100, .categoryID = 28, .eventName = "Oxbow", .payload = {{"a", 1}}});

  EXPECT_EQ(shown(Kind::kPower), "1970-01-01 00:01:40.000  28  Oxbow  a=1\n");
  EXPECT_EQ(shown(Kind::kPower, OutputForm::kJson),
            "{\"time\":100.0,\"category_id\":28,\"event_name\":\"Oxbow\",\"payload\":{\"a\":1},"
            "\"cursor\":\"power:1@100\"}\n");
}

TEST_F(RecordsTest, LinkMessagesAreShownWithTheirParty) {
  storeLink(100, -1, 3, 9);

  EXPECT_EQ(shown(Kind::kLink), "1970-01-01 00:01:40.000  -1  music  Input/AudioUnitUsage  a=1\n");
  EXPECT_EQ(
      shown(Kind::kLink, OutputForm::kJson),
      "{\"time\":100.0,\"session_id\":-1,\"client_name\":\"client\",\"service_name\":"
      "\"music\",\"category\":3,\"type\":9,\"payload\":{\"a\":1},"
      "\"category_name\":\"Input\",\"type_name\":\"AudioUnitUsage\",\"cursor\":\"link:1@100\"}\n");
}

TEST_F(RecordsTest, SnapshotsAreShownWithPathAndSignature) {
  store_->snapshots().add({.time = 100, .signature = {{"Type", "haptics"}}, .path = "/s/1.zst"});

  EXPECT_EQ(shown(Kind::kSnapshots), "1970-01-01 00:01:40.000  /s/1.zst  Type=haptics\n");
  EXPECT_EQ(shown(Kind::kSnapshots, OutputForm::kJson),
            "{\"time\":100.0,\"signature\":{\"Type\":\"haptics\"},\"path\":\"/s/"
            "1.zst\",\"cursor\":\"snapshots:1@100\"}\n");
}

TEST_F(RecordsTest, LinkMessagesAreChosenByTheirNumbersTogether) {
  storeLink(100, 7, 1, 1);
  storeLink(101, 7, 2, 1);
  storeLink(102, 7, 2, 5);
  storeLink(103, 8, 2, 5);

  const std::string one = shown(ShowRecords{Kind::kLink, {}, {7}, {2}, {5, 6}});
  const std::string newest = shown(ShowRecords{Kind::kLink, {.last = 1}, {7}, {}, {}});

  EXPECT_EQ(one, "1970-01-01 00:01:42.000  7  music  Record/Setup  a=1\n");
  EXPECT_EQ(newest, one);
}

TEST_F(RecordsTest, NamesChooseAmongPowerEventsAndServices) {
  storeLink(100, 1, 1, 1, "music");
  storeLink(101, 2, 1, 1, "speech");
  store_->powerEvents().add({.time = 100, .categoryID = 1, .eventName = "One"});
  store_->powerEvents().add({.time = 100, .categoryID = 1, .eventName = "Other"});

  EXPECT_EQ(shown(ShowRecords{Kind::kLink, {.names = {"sp*"}}, {}, {}, {}}),
            "1970-01-01 00:01:41.000  2  speech  Generic/Start  a=1\n");
  EXPECT_THAT(shown(ShowRecords{Kind::kPower, {.names = {"Ot*"}}, {}, {}, {}}),
              testing::AllOf(HasSubstr("Other"), Not(HasSubstr("One"))));
}

TEST_F(RecordsTest, NothingThatAClientSentDrivesTheTerminal) {
  const std::string evil = "e\x1B[2J\xC2\x9B\n";
  storeLink(100, 1, 1, 1, evil);
  store_->powerEvents().add({.time = 100, .categoryID = 1, .eventName = evil});
  store_->snapshots().add({.time = 100, .signature = {{"k", evil}}, .path = evil});

  for (const Kind kind : {Kind::kLink, Kind::kPower, Kind::kSnapshots}) {
    for (const auto form : {OutputForm::kText, OutputForm::kJson}) {
      const std::string line = shown(kind, form);
      EXPECT_EQ(line.find('\x1B'), std::string::npos) << line;
      EXPECT_EQ(line.find("\xC2\x9B"), std::string::npos) << line;
      EXPECT_EQ(line.find('\n'), line.size() - 1) << line;
    }
  }
}

TEST_F(RecordsTest, AMissingStoreIsReportedByTheCommand) {
  ShowRecords request{Kind::kPower, {}, {}, {}, {}};
  request.selection.database = scratch_.path("elsewhere");
  std::ostringstream out;

  EXPECT_NE(showRecords(request, OutputForm::kText, out, -1, errors_), ExitStatus::kDone);
  EXPECT_THAT(errors_.str(), HasSubstr("halvoxctl power: "));
}

}  // namespace
}  // namespace halvox::tools
