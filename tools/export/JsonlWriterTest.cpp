#include "tools/export/JsonlWriter.h"

#include <gtest/gtest.h>

#include "tools/export/testing/RecordItems.h"

namespace halvox::tools {
namespace {

std::string lineOf(const platform::linux_::StoredItem& item) {
  return written(*makeJsonlWriter(), item);
}

TEST(JsonlWriterTest, EveryKindHasTheColumnsOfItsTable) {
  EXPECT_EQ(lineOf(eventItem("{\"n\":1}", "org.player")),
            "{\"kind\":\"events\",\"id\":8,\"time\":1700000000.25,"
            "\"name\":\"com.tarno.halvox.Session_Playback.Start\",\"application\":\"org.player\","
            "\"payload\":{\"n\":1}}\n");
  EXPECT_EQ(lineOf(linkItem("{}")),
            "{\"kind\":\"link\",\"id\":9,\"time\":1700000001,\"session_id\":-1,"
            "\"client_name\":\"com.tarno.halvox\",\"service_name\":\"longformaudio_session\","
            "\"category\":4,\"type\":1,\"payload\":{}}\n");
  EXPECT_EQ(lineOf(metricItem(std::string_view("\0\xFFz", 3))),
            "{\"kind\":\"metrics\",\"id\":3,\"time\":1700000002,\"metric_id\":5963779,"
            "\"message\":\"00ff7a\"}\n");
  EXPECT_EQ(lineOf(powerItem("{\"a\":2.50}")),
            "{\"kind\":\"power\",\"id\":4,\"time\":1700000003,\"category_id\":28,"
            "\"event_name\":\"Oxbow_Haptics\",\"payload\":{\"a\":2.50}}\n");
  EXPECT_EQ(lineOf(snapshotItem("{}")),
            "{\"kind\":\"snapshots\",\"id\":5,\"time\":1700000004,\"signature\":{},"
            "\"path\":\"/var/lib/halvox/a, b.tar\"}\n");
  EXPECT_EQ(lineOf(lossItem("dropped: disk full")),
            "{\"kind\":\"losses\",\"id\":6,\"time\":1700000005,\"piece\":\"link local\","
            "\"reason\":\"dropped: disk full\",\"count\":12}\n");
}

TEST(JsonlWriterTest, NoDigitOfAPayloadIsLost) {
  const std::string payload =
      "{\"a\":18446744073709551615,\"b\":0.1000000000000000055511151231257827,\"c\":1.0}";
  EXPECT_NE(lineOf(eventItem(payload)).find(payload), std::string::npos);
}

TEST(JsonlWriterTest, ADamagedPayloadIsAStringOnItsLine) {
  const std::string line = lineOf(eventItem("{\"a\":\n1"));
  EXPECT_NE(line.find("\"payload\":\"{\\\"a\\\":\\n1\"}"), std::string::npos) << line;
  EXPECT_EQ(line.find('\n'), line.size() - 1);
}

TEST(JsonlWriterTest, RecordsFollowEachOtherWithoutAnythingAround) {
  const auto writer = makeJsonlWriter();
  EXPECT_EQ(written(*writer), "");
  EXPECT_EQ(written(*writer, linkItem("{}"), linkItem("{}")),
            lineOf(linkItem("{}")) + lineOf(linkItem("{}")));
}

}  // namespace
}  // namespace halvox::tools
