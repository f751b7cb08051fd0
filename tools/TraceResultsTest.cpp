#include "tools/TraceResults.h"

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include <gtest/gtest.h>
#include <rapidjson/document.h>

namespace halvox::tools {
namespace {

class TraceResultsTest : public testing::Test {
 protected:
  ~TraceResultsTest() override { std::filesystem::remove(file_); }

  auto read(const std::string& text) {
    std::ofstream(file_) << text;
    return readTraceResults(file_);
  }

  const std::string file_ = testing::TempDir() + "halvox-trace-results";
};

TEST_F(TraceResultsTest, NamesStandAsInTheFileWithTheirValues) {
  const auto read = this->read(
      R"({"product": "P", "version": 4, "unit": "ns", "values": {"b": [2.5, null, 1], "a": []}})");

  ASSERT_TRUE(read);
  EXPECT_EQ(read->product, "P");
  ASSERT_EQ(read->values.size(), 2U);
  EXPECT_EQ(read->values[0].first, "b");
  EXPECT_EQ(read->values[0].second, (std::vector<double>{2.5, 1}));
  EXPECT_TRUE(read->values[1].second.empty());
}

TEST_F(TraceResultsTest, AFileThatHasNoResultsIsAnError) {
  for (const char* text : {"", "{", "[]", "{}", R"({"product": 1, "unit": "ns", "values": {}})",
                           R"({"product": "P", "unit": "s", "values": {}})",
                           R"({"product": "P", "unit": "ns", "values": {"a": 1}})"}) {
    EXPECT_FALSE(read(text)) << text;
  }
  EXPECT_FALSE(readTraceResults("/nowhere"));
}

TEST_F(TraceResultsTest, StatisticsAreValuesThatWereMeasured) {
  std::vector<double> values;
  for (int value = 100; value >= 1; --value) values.push_back(value);

  const TraceStatistics found = statisticsOf(values);

  EXPECT_EQ(found.count, 100U);
  EXPECT_EQ(found.minimum, 1);
  EXPECT_EQ(found.median, 50);
  EXPECT_EQ(found.percentile95, 95);
  EXPECT_EQ(found.maximum, 100);
  EXPECT_EQ(statisticsOf({7}).percentile95, 7);
}

TEST_F(TraceResultsTest, IntervalsOfOneNameFollowEachOther) {
  std::ostringstream out;

  writeTraceEvents({.product = "P", .values = {{"a", {1000, 2000}}, {"b", {500}}}}, out);

  rapidjson::Document document;
  document.Parse(out.str().c_str());
  ASSERT_TRUE(document.IsObject());
  const auto& events = document["traceEvents"];
  ASSERT_EQ(events.Size(), 6U);  // three names, three intervals
  EXPECT_STREQ(events[1]["args"]["name"].GetString(), "a");
  EXPECT_EQ(events[3]["ts"].GetDouble(), 1);
  EXPECT_EQ(events[3]["dur"].GetDouble(), 2);
  EXPECT_STREQ(events[5]["name"].GetString(), "b");
  EXPECT_EQ(events[5]["ts"].GetDouble(), 0);
  EXPECT_EQ(events[5]["dur"].GetDouble(), 0.5);
}

TEST_F(TraceResultsTest, IntervalsThatAddUpToMoreThanANumberHoldsAreStillJson) {
  std::ostringstream out;

  writeTraceEvents({.product = "P", .values = {{"a", {1.7e308, 1.7e308, 1}}}}, out);

  rapidjson::Document document;
  document.Parse(out.str().c_str());
  ASSERT_TRUE(document.IsObject());
  EXPECT_EQ(document["traceEvents"].Size(), 5U);  // two names, three intervals
}

}  // namespace
}  // namespace halvox::tools
