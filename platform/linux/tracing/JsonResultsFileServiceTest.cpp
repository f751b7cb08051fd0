#include "platform/linux/tracing/JsonResultsFileService.h"

#include <cmath>
#include <filesystem>
#include <fstream>
#include <limits>
#include <string>

#include <gtest/gtest.h>
#include <rapidjson/document.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kPath = "/logs/traces/results.ssj";

class JsonResultsFileServiceTest : public testing::Test {
 protected:
  JsonResultsFileServiceTest() { std::filesystem::create_directories(root_ / "logs/traces"); }

  ResultsFileService::Writer open(const char* path = kPath) {
    return service_.sswriter_open(path, "Product", 4, 0);
  }
  void add(ResultsFileService::Writer& writer, const char* name, double value) {
    service_.sswriter_new_value(*writer, name, ssunit::ssunit_nanoseconds, value);
  }
  rapidjson::Document written() const {
    std::ifstream file(root_ / "logs/traces/results.ssj");
    const std::string text((std::istreambuf_iterator<char>(file)), {});
    rapidjson::Document document;
    document.Parse<rapidjson::kParseFullPrecisionFlag>(text.data(), text.size());
    return document;
  }
  std::uint64_t count(const char* name) {
    return platform_.statistics.counter("results files", name).value();
  }

  FakePlatform platform_;
  const ScratchDirectory directory_;
  const std::filesystem::path scratch_ = directory_.path();
  const std::filesystem::path root_ = scratch_ / "root";
  JsonResultsFileService service_{root_, platform_.log, platform_.statistics};
};

TEST_F(JsonResultsFileServiceTest, FileHasProductVersionUnitAndValuesByName) {
  auto writer = open();
  ASSERT_NE(writer, nullptr);
  add(writer, "second", 2.5);
  add(writer, "first", 1);
  add(writer, "second", 3);
  service_.sswriter_close(std::move(writer));

  const auto document = written();
  ASSERT_TRUE(document.IsObject());
  EXPECT_STREQ(document["product"].GetString(), "Product");
  EXPECT_EQ(document["version"].GetUint(), 4U);
  EXPECT_STREQ(document["unit"].GetString(), "ns");
  const auto values = document["values"].GetObject();
  ASSERT_EQ(values.MemberCount(), 2U);
  EXPECT_STREQ(values.MemberBegin()->name.GetString(), "second");
  ASSERT_EQ(values["second"].Size(), 2U);
  EXPECT_EQ(values["second"][0].GetDouble(), 2.5);
  EXPECT_EQ(values["second"][1].GetDouble(), 3);
  EXPECT_EQ(values["first"][0].GetDouble(), 1);
  EXPECT_EQ(count("files written"), 1U);
  EXPECT_EQ(count("values taken"), 3U);
}

TEST_F(JsonResultsFileServiceTest, NumbersKeepTheirFullPrecision) {
  const double largest = static_cast<double>(std::numeric_limits<std::uint64_t>::max());
  auto writer = open();
  for (const double value : {0.1, 1.0 / 3, 123'456'789'012'345.0, largest}) add(writer, "n", value);
  service_.sswriter_close(std::move(writer));

  const auto document = written();
  const auto& values = document["values"]["n"];
  EXPECT_EQ(values[0].GetDouble(), 0.1);
  EXPECT_EQ(values[1].GetDouble(), 1.0 / 3);
  EXPECT_EQ(values[2].GetDouble(), 123'456'789'012'345.0);
  EXPECT_EQ(values[3].GetDouble(), largest);
}

TEST_F(JsonResultsFileServiceTest, WhatIsNoNumberIsNull) {
  auto writer = open();
  add(writer, "n", std::nan(""));
  add(writer, "n", HUGE_VAL);
  service_.sswriter_close(std::move(writer));

  const auto document = written();
  EXPECT_TRUE(document["values"]["n"][0].IsNull());
  EXPECT_TRUE(document["values"]["n"][1].IsNull());
}

TEST_F(JsonResultsFileServiceTest, FileWithoutValuesIsWhole) {
  service_.sswriter_close(open());

  const auto document = written();
  ASSERT_TRUE(document.IsObject());
  EXPECT_EQ(document["values"].MemberCount(), 0U);
}

TEST_F(JsonResultsFileServiceTest, OldFileStaysUntilTheNewOneIsWhole) {
  service_.sswriter_close(open());
  auto writer = open();
  add(writer, "n", 1);

  EXPECT_EQ(written()["values"].MemberCount(), 0U);
  service_.sswriter_close(std::move(writer));

  EXPECT_EQ(written()["values"].MemberCount(), 1U);
}

TEST_F(JsonResultsFileServiceTest, WriterThatIsLetGoLeavesNothing) {
  open().reset();

  EXPECT_TRUE(std::filesystem::is_empty(root_ / "logs/traces"));
}

TEST_F(JsonResultsFileServiceTest, MissingDirectoryGivesNoWriter) {
  EXPECT_EQ(open("/missing/results.ssj"), nullptr);

  EXPECT_EQ(count("files that failed"), 1U);
  const auto errors = platform_.log.texts(LogLevel::kError);
  ASSERT_EQ(errors.size(), 1U);
  EXPECT_NE(errors.front().find("/missing"), std::string::npos) << errors.front();
}

TEST_F(JsonResultsFileServiceTest, LinkThatLeadsOutOfTheRootGivesNoWriter) {
  std::filesystem::create_directory(scratch_ / "outside");
  std::filesystem::create_directory_symlink(scratch_ / "outside", root_ / "link");

  EXPECT_EQ(open("/link/results.ssj"), nullptr);
  EXPECT_EQ(open("/logs/traces/.."), nullptr);
}

TEST_F(JsonResultsFileServiceTest, NamesThatAreNotUtf8MakeAFileThatCanBeRead) {
  auto writer = open();
  add(writer, "a\xFF", 1);
  service_.sswriter_close(std::move(writer));

  EXPECT_TRUE(written()["values"].HasMember("a\uFFFD"));
}

}  // namespace
}  // namespace halvox::platform::linux_
