#include "tools/ReportJson.h"

#include <cmath>
#include <memory>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <rapidjson/document.h>

namespace halvox::tools {
namespace {

using analysis::ReportData;
using analysis::ReportMessage;
using ::testing::HasSubstr;
using ::testing::Not;

std::string jsonOf(const ReportData& data, const ReportFrame& frame = {}) {
  std::string json;
  appendReportJson(data, frame, json);
  return json;
}

rapidjson::Document parsed(const std::string& json) {
  rapidjson::Document document;
  document.Parse(json.c_str());
  EXPECT_FALSE(document.HasParseError()) << json;
  return document;
}

TEST(ReportJsonTest, AnEmptyReportIsComplete) {
  const auto json = parsed(jsonOf(ReportData()));

  EXPECT_TRUE(json["period"].IsNull());
  EXPECT_TRUE(json["asked"]["since"].IsNull());
  EXPECT_TRUE(json["traces"].IsNull());
  for (const char* list : {"streams", "xruns", "messages", "byApplication", "devices",
                           "deviceCounters", "issues", "power", "marks", "losses", "notes"}) {
    EXPECT_TRUE(json[list].IsArray()) << list;
  }
}

TEST(ReportJsonTest, NoTextEndsTheElementThatHoldsTheReport) {
  ReportData data;
  const std::string hostile = "</script><!--<script>\"\\ \xE2\x80\xAE";
  data.xruns.push_back({.application = hostile});

  const std::string json = jsonOf(data, {.store = hostile});

  EXPECT_THAT(json, Not(HasSubstr("<")));
  EXPECT_EQ(parsed(json)["xruns"][0]["app"].GetString(), hostile);
}

TEST(ReportJsonTest, BytesThatAreNotUtf8AreReplaced) {
  ReportData data;
  data.power.push_back({.name = "a\xFF", .count = 1});

  EXPECT_STREQ(parsed(jsonOf(data))["power"][0]["name"].GetString(), "a\xEF\xBF\xBD");
}

TEST(ReportJsonTest, LargeNumbersStayNumbers) {
  ReportData data;
  data.totals.xrunMilliseconds = 1e306;

  EXPECT_EQ(parsed(jsonOf(data))["totals"]["xrunMs"].GetDouble(), 1e306);
}

TEST(ReportJsonTest, NumbersThatJsonCannotHoldAreNull) {
  ReportData data;
  data.totals.xrunMilliseconds = NAN;
  data.deviceTimes.emplace_back().counts.add(50, INFINITY, 2);

  const auto json = parsed(jsonOf(data));

  EXPECT_TRUE(json["totals"]["xrunMs"].IsNull());
  EXPECT_TRUE(json["devices"][0]["buckets"][0][1].IsNull());
  EXPECT_EQ(json["devices"][0]["buckets"][0][2].GetInt(), 2);
}

TEST(ReportJsonTest, XrunsPointToTheirStreamsAndMessages) {
  ReportData data;
  const auto message = [](std::int64_t id) {
    return std::make_shared<const ReportMessage>(
        ReportMessage{.id = id, .payload = R"({"number":1})"});
  };
  const auto shared = message(12);
  data.streams.resize(2);
  data.streams[0].story.id = 3;
  data.streams[1].story.id = 4;
  data.xruns.push_back({.messageID = 12, .storyID = 4, .around = {message(10), shared}});
  data.xruns.push_back({.messageID = 14, .storyID = 99, .around = {shared, message(14)}});

  const auto json = parsed(jsonOf(data));

  EXPECT_EQ(json["messages"].Size(), 3U);
  EXPECT_STREQ(json["messages"][0]["text"].GetString(), "number=1");
  EXPECT_EQ(json["xruns"][0]["s"].GetInt(), 1);
  EXPECT_EQ(json["xruns"][0]["message"].GetInt(), 1);
  EXPECT_EQ(json["xruns"][0]["around"][0].GetInt(), 0);
  EXPECT_EQ(json["xruns"][0]["around"][1].GetInt(), 2);
  EXPECT_EQ(json["xruns"][1]["s"].GetInt(), -1);  // its stream is not in the report
  EXPECT_EQ(json["xruns"][1]["message"].GetInt(), 2);
}

TEST(ReportJsonTest, OnlyTheNamesThatAllServicesShareAreDrawn) {
  ReportData data;
  data.names.add("com.tarno.halvox.Volume.State", 100);
  data.names.add("com.tarno.telephony.Volume.State", 100);

  const auto json = parsed(jsonOf(data));
  const auto& series = json["names"]["series"];

  ASSERT_EQ(series.Size(), 2U);
  EXPECT_TRUE(series[0]["drawn"].GetBool());
  EXPECT_EQ(series[0]["bins"][0][1].GetInt(), 1);
  EXPECT_FALSE(series[1]["drawn"].GetBool());
  EXPECT_EQ(series[1]["count"].GetInt(), 1);
}

}  // namespace
}  // namespace halvox::tools
