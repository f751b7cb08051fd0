#include "tools/export/OtlpWriter.h"

#include <string>
#include <vector>

#include <gmock/gmock.h>

#include "tools/export/OtlpValue.h"
#include "tools/export/testing/RecordItems.h"

namespace halvox::tools {
namespace {

using platform::linux_::StoredItem;
using ::testing::HasSubstr;
using ::testing::Not;

std::string valueOf(std::string_view json) {
  JsonBuffer buffer;
  JsonWriter writer(buffer);
  writeOtlpValue(writer, json);
  return {buffer.GetString(), buffer.GetSize()};
}

std::string requestOf(const StoredItem& item) { return written(*makeOtlpWriter("1.2"), item); }

TEST(OtlpValueTest, ValuesHaveTheirType) {
  EXPECT_EQ(valueOf("\"a\\\"b\""), R"({"stringValue":"a\"b"})");
  EXPECT_EQ(valueOf("true"), R"({"boolValue":true})");
  EXPECT_EQ(valueOf("-7"), R"({"intValue":"-7"})");
  EXPECT_EQ(valueOf("9223372036854775807"), R"({"intValue":"9223372036854775807"})");
  EXPECT_EQ(valueOf("9223372036854775808"), R"({"doubleValue":9223372036854775808})");
  EXPECT_EQ(valueOf("1.50"), R"({"doubleValue":1.50})");
  EXPECT_EQ(valueOf("null"), "{}");
}

TEST(OtlpValueTest, ContainersNest) {
  EXPECT_EQ(valueOf("[]"), R"({"arrayValue":{"values":[]}})");
  EXPECT_EQ(valueOf("{}"), R"({"kvlistValue":{"values":[]}})");
  EXPECT_EQ(valueOf(R"({"a":[1,{"b":null}],"c":"d"})"),
            R"({"kvlistValue":{"values":[{"key":"a","value":{"arrayValue":{"values":[)"
            R"({"intValue":"1"},{"kvlistValue":{"values":[{"key":"b","value":{}}]}}]}}},)"
            R"({"key":"c","value":{"stringValue":"d"}}]}})");
}

TEST(OtlpValueTest, WhatIsNotJsonIsAText) {
  EXPECT_EQ(valueOf("{\"a\":"), R"({"stringValue":"{\"a\":"})");
  EXPECT_EQ(valueOf(""), R"({"stringValue":""})");
}

TEST(OtlpWriterTest, ARecordIsARequestOnOneLine) {
  EXPECT_EQ(
      requestOf(eventItem("{\"hvreporting_timestamp\":1699999999.5}", "org.player")),
      R"({"resourceLogs":[{"resource":{"attributes":[{"key":"service.name","value":)"
      R"({"stringValue":"halvox-reportingd"}}]},"scopeLogs":[{"scope":{"name":"halvoxctl",)"
      R"("version":"1.2"},"logRecords":[{"timeUnixNano":"1699999999500000000",)"
      R"("observedTimeUnixNano":"1700000000250000000","severityNumber":9,"severityText":"INFO",)"
      R"("eventName":"com.tarno.halvox.Session_Playback.Start","body":{"kvlistValue":{"values":[)"
      R"({"key":"hvreporting_timestamp","value":{"doubleValue":1699999999.5}}]}},"attributes":[)"
      R"({"key":"halvox.kind","value":{"stringValue":"events"}},)"
      R"({"key":"halvox.record.id","value":{"intValue":"8"}},)"
      R"({"key":"halvox.application","value":{"stringValue":"org.player"}}]}]}]}]})"
      "\n");
}

TEST(OtlpWriterTest, OtherKindsHaveTheirAttributesAndBody) {
  const std::string link = requestOf(linkItem("{\"audiotag\":\"Session_PlaybackStart\"}", 7));
  EXPECT_THAT(link, HasSubstr(R"({"key":"halvox.session.id","value":{"intValue":"7"}})"));
  EXPECT_THAT(link,
              HasSubstr(R"({"key":"halvox.category","value":{"stringValue":"Session_Playback"}})"));
  EXPECT_THAT(link, HasSubstr(R"({"key":"halvox.type","value":{"stringValue":"Start"}})"));
  EXPECT_THAT(link, HasSubstr(R"("timeUnixNano":"1700000001000000000")"));
  EXPECT_THAT(link, Not(HasSubstr("eventName")));
  EXPECT_THAT(requestOf(snapshotItem("{}")),
              HasSubstr(R"({"key":"halvox.snapshot.path","value":{"stringValue":"/var)"));
  EXPECT_THAT(requestOf(powerItem("{}")),
              HasSubstr(R"({"key":"halvox.power.category","value":{"intValue":"28"}})"));
  for (const auto& [bytes, text] :
       std::vector<std::pair<std::string, std::string>>{{"", ""},
                                                        {"f", "Zg=="},
                                                        {"fo", "Zm8="},
                                                        {"foo", "Zm9v"},
                                                        {"\xFF\xFE\xFD!", "//79IQ=="}}) {
    EXPECT_THAT(requestOf(metricItem(bytes)),
                HasSubstr(R"("body":{"bytesValue":")" + text + "\"}"));
  }
}

TEST(OtlpWriterTest, ALossIsAWarningAboutAPieceOfTheService) {
  const std::string loss = requestOf(lossItem("dropped: disk full"));
  EXPECT_THAT(loss,
              HasSubstr(R"("severityText":"WARN","body":{"stringValue":"dropped: disk full"})"));
  EXPECT_THAT(loss, HasSubstr(R"({"key":"halvox.kind","value":{"stringValue":"losses"}})"));
  EXPECT_THAT(loss,
              HasSubstr(R"({"key":"halvox.loss.piece","value":{"stringValue":"link local"}})"));
  EXPECT_THAT(loss, HasSubstr(R"({"key":"halvox.loss.count","value":{"intValue":"12"}})"));
}

TEST(OtlpWriterTest, IssuesAreWarningsAndErrorsAreErrors) {
  StoredItem item = eventItem("{}");
  item.name = "com.tarno.halvox.Session_Playback.IssueDetector";
  EXPECT_THAT(requestOf(item), HasSubstr(R"("severityNumber":13,"severityText":"WARN")"));
  item.name = "com.tarno.halvox.Session_Playback.Error";
  EXPECT_THAT(requestOf(item), HasSubstr(R"("severityNumber":17,"severityText":"ERROR")"));
  StoredItem link = linkItem("{}");
  link.type = 7;
  EXPECT_THAT(requestOf(link), HasSubstr(R"("severityNumber":13)"));
  EXPECT_THAT(requestOf(metricItem("")), HasSubstr(R"("severityNumber":13)"));
}

TEST(OtlpWriterTest, ATimeThatTheFormatCannotHoldIsUnknown) {
  StoredItem item = eventItem("{}");
  for (const double time : {-1.0, 1e300, 0.0}) {
    item.time = time;
    EXPECT_THAT(requestOf(item), HasSubstr(R"("timeUnixNano":"0")"));
  }
}

TEST(OtlpWriterTest, RequestsAreBounded) {
  const auto writer = makeOtlpWriter("");
  std::string text;
  const StoredItem item = eventItem("{}");
  for (std::size_t record = 0; record < 2 * kMostOtlpRecords; ++record) writer->add(item, text);
  writer->finish(text);
  EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 2);

  text.clear();
  const std::string large = "{\"a\":\"" + std::string(kMostOtlpBytes, 'x') + "\"}";
  for (int record = 0; record < 3; ++record) writer->add(eventItem(large), text);
  writer->finish(text);
  EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 3);
}

TEST(OtlpWriterTest, WithoutRecordsThereIsNoRequest) {
  EXPECT_EQ(written(*makeOtlpWriter("")), "");
}

}  // namespace
}  // namespace halvox::tools
