#include "tools/export/CsvWriter.h"

#include <gtest/gtest.h>

#include "tools/export/testing/RecordItems.h"

namespace halvox::tools {
namespace {

using platform::linux_::StoredItem;

constexpr std::string_view kHeader =
    "kind,id,time,time_utc,application,name,session_id,client_name,service_name,category,type,"
    "metric_id,payload,path,reason,count\r\n";

// The lines after the header.
template <typename... Items>
std::string linesOf(const Items&... items) {
  const std::string text = written(*makeCsvWriter(), items...);
  EXPECT_TRUE(text.starts_with(kHeader)) << text;
  return text.substr(kHeader.size());
}

std::string lineWithName(std::string_view name) {
  StoredItem item = eventItem("{}");
  item.name = name;
  return linesOf(item);
}

TEST(CsvWriterTest, AHeaderNamesTheColumns) { EXPECT_EQ(linesOf(), ""); }

TEST(CsvWriterTest, EachKindFillsItsColumns) {
  EXPECT_EQ(linesOf(eventItem("{}", "org.player")),
            "events,8,1700000000.25,2023-11-14T22:13:20.250Z,org.player,"
            "com.tarno.halvox.Session_Playback.Start,,,,,,,{},,,\r\n");
  EXPECT_EQ(linesOf(linkItem("{}")),
            "link,9,1700000001,2023-11-14T22:13:21.000Z,,,-1,com.tarno.halvox,"
            "longformaudio_session,4,1,,{},,,\r\n");
  EXPECT_EQ(linesOf(metricItem("\x01\xFF")),
            "metrics,3,1700000002,2023-11-14T22:13:22.000Z,,,,,,,,5963779,01ff,,,\r\n");
  EXPECT_EQ(linesOf(powerItem("{}")),
            "power,4,1700000003,2023-11-14T22:13:23.000Z,,Oxbow_Haptics,,,,28,,,{},,,\r\n");
  EXPECT_EQ(linesOf(snapshotItem("{}")),
            "snapshots,5,1700000004,2023-11-14T22:13:24.000Z,,,,,,,,,{},"
            "\"/var/lib/halvox/a, b.tar\",,\r\n");
  EXPECT_EQ(linesOf(lossItem("dropped: disk full")),
            "losses,6,1700000005,2023-11-14T22:13:25.000Z,,link local,,,,,,,,,dropped: disk full,12"
            "\r\n");
}

TEST(CsvWriterTest, FieldsWithCommasQuotesAndLineBreaksAreQuoted) {
  EXPECT_NE(linesOf(eventItem("{\"a\":1,\"b\":2}")).find(",\"{\"\"a\"\":1,\"\"b\"\":2}\","),
            std::string::npos);
  EXPECT_NE(lineWithName("two\nlines").find(",\"two\nlines\","), std::string::npos);
  EXPECT_NE(lineWithName("a\rb").find(",\"a\rb\","), std::string::npos);
}

TEST(CsvWriterTest, NoTextBeginsLikeAFormula) {
  for (const char* text : {"=1+2", "+1", "-1", "@SUM(1)", "\tx", "\uFF1D1", "\uFF20x"}) {
    EXPECT_NE(lineWithName(text).find(std::string(",'") + text + ","), std::string::npos) << text;
  }
  EXPECT_NE(lineWithName("=cmd|\"a\"").find(",\"'=cmd|\"\"a\"\"\","), std::string::npos);
  EXPECT_NE(linesOf(eventItem("=damaged")).find(",'=damaged,"), std::string::npos);
  EXPECT_NE(lineWithName("a=b").find(",a=b,"), std::string::npos);
}

TEST(CsvWriterTest, ATimeWithoutADateHasNone) {
  StoredItem item = eventItem("{}");
  item.time = 1e300;
  EXPECT_TRUE(linesOf(item).starts_with("events,8,1e+300,,"));
}

}  // namespace
}  // namespace halvox::tools
