#include "tools/Summary.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/testing/ScratchDirectory.h"
#include "tools/SummaryReader.h"

namespace halvox::tools {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::StartsWith;

constexpr const char* kName = "20231114-221320+0000-halvox-org.example-player-haptics.json";
constexpr const char* kText = R"([
  {"Playback_Start_1": {"hvreporting_timestamp": 10.5, "sample_rate": 48000}},
  {"Playback_Stop_1": {"hvreporting_timestamp": 12, "why": "a\u001b[31m", "in": {"x": [1, null]}}},
  {"Volume_Summary_1": {"volume": 0.5}}
])";

class SummaryTest : public testing::Test {
 protected:
  SummaryTest() {
    ::setenv("HALVOX_CONFIG", (scratch_ / "halvox.toml").c_str(), 1);
    std::ofstream(scratch_ / "halvox.toml")
        << "[storage]\nroot = \"" << (scratch_ / "root").string() << "\"\n";
  }
  ~SummaryTest() override { ::unsetenv("HALVOX_CONFIG"); }

  std::string write(const fs::path& name, const std::string& text) {
    fs::create_directories((scratch_ / name).parent_path());
    std::ofstream(scratch_ / name) << text;
    return (scratch_ / name).string();
  }
  ExitStatus show(std::vector<std::string> files, OutputForm form = OutputForm::kText,
                  std::uint64_t last = 10) {
    out_.str("");
    errors_.str("");
    return showSummaries({.files = std::move(files), .last = last}, form, out_, errors_);
  }
  // What is wrong with a file of that text.
  std::string problemOf(const std::string& text) {
    const auto read = readSummary(write("broken.json", text), nullptr);
    EXPECT_FALSE(read) << text;
    return read ? "" : read.error().message;
  }

  static constexpr const char* kStore =
      "root/private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Reporting";
  const platform::linux_::ScratchDirectory directory_;
  const fs::path scratch_ = directory_.path();
  std::ostringstream out_;
  std::ostringstream errors_;
};

TEST_F(SummaryTest, NameIsTakenApartFromBothEnds) {
  const auto name = parseSummaryName("20231114-204320-0130-halvox-a-halvox-b-telephony.json");

  ASSERT_TRUE(name.has_value());
  EXPECT_EQ(name->time, "2023-11-14 20:43:20 -0130");
  EXPECT_EQ(name->secondsSince1970, 1'700'000'000);
  EXPECT_EQ(name->application, "a-halvox-b");
  EXPECT_EQ(name->service, "telephony");
}

TEST_F(SummaryTest, OtherNamesAreNotParsed) {
  for (const char* name :
       {"", ".json", "20231114-204320-0130-halvox-a.json", "20231314-204320-0130-halvox-a-b.json",
        "20231114-204320-0130-halvox-a-b", "20231114-204320-0130-other-a-b.json",
        "2023x114-204320-0130-halvox-a-b.json", ".halvox-1-2.tmp"}) {
    EXPECT_FALSE(parseSummaryName(name).has_value()) << name;
  }
}

TEST_F(SummaryTest, OneFileIsShownWithItsMessages) {
  EXPECT_EQ(show({write(kName, kText)}), ExitStatus::kDone);

  EXPECT_EQ(out_.str(),
            "TIME                       APPLICATION         SERVICE  MESSAGES  SECONDS  VOLUMES\n"
            "2023-11-14 22:13:20 +0000  org.example-player  haptics  3         1.500    1\n"
            "\n"
            "Playback_Start_1  hvreporting_timestamp=10.5 sample_rate=48000\n"
            "Playback_Stop_1  hvreporting_timestamp=12 why=\"a\\u001B[31m\" in={\"x\":[1,null]}\n"
            "Volume_Summary_1  volume=0.5\n");
  EXPECT_EQ(errors_.str(), "");
}

TEST_F(SummaryTest, JsonIsOneObjectALine) {
  const std::string file = write("other.json", R"([{"A": {"b": "c"}}])");

  EXPECT_EQ(show({file}, OutputForm::kJson), ExitStatus::kDone);

  EXPECT_EQ(out_.str(), "{\"file\":\"" + file +
                            "\",\"time\":\"\",\"application\":\"\",\"service\":\"\",\"messages\":1,"
                            "\"volume_intervals\":0}\n"
                            "{\"identifier\":\"A\",\"message\":{\"b\":\"c\"}}\n");
}

TEST_F(SummaryTest, NewestOfTheStoreAreShownNewestLast) {
  const fs::path store(kStore);
  write(store / "20231114-221320+0000-halvox-second-haptics.json", "[]");
  write(store / "20231114-221320+0100-halvox-first-haptics.json", "[]");
  write(store / "20231114-203000-0200-halvox-third-haptics.json", "[]");
  write(store / "notes.txt", "");

  EXPECT_EQ(show({}, OutputForm::kText, 2), ExitStatus::kDone);

  const std::string shown = out_.str();
  EXPECT_EQ(shown.find("first"), std::string::npos);
  EXPECT_LT(shown.find("second"), shown.find("third"));
  EXPECT_NE(shown.find("third"), std::string::npos);
}

TEST_F(SummaryTest, StoreWithoutSummariesIsAnError) {
  EXPECT_EQ(show({}), ExitStatus::kNoService);
  EXPECT_THAT(errors_.str(), HasSubstr("Audio/Reporting: No such file or directory"));
  fs::create_directories(scratch_ / kStore);

  EXPECT_EQ(show({}), ExitStatus::kNoService);
  EXPECT_THAT(errors_.str(), HasSubstr("has no summaries"));
}

TEST_F(SummaryTest, BrokenFileIsReportedAndTheOthersAreShown) {
  const std::string broken = write("broken.json", "[{\"A\": {\"b\": 1}");

  EXPECT_EQ(show({write(kName, kText), broken}), ExitStatus::kBadArguments);

  EXPECT_THAT(out_.str(), HasSubstr("org.example-player"));
  EXPECT_THAT(errors_.str(),
              StartsWith("halvoxctl summary: " + broken + ": is not a summary: line 1, column "));
}

TEST_F(SummaryTest, MissingFilesAndDirectoriesAreErrors) {
  EXPECT_EQ(show({(scratch_ / "missing").string()}), ExitStatus::kBadArguments);
  EXPECT_THAT(errors_.str(), HasSubstr("missing: No such file or directory"));

  EXPECT_EQ(show({scratch_.string()}), ExitStatus::kBadArguments);
  EXPECT_THAT(errors_.str(), HasSubstr("is not a file"));
}

TEST_F(SummaryTest, FilesThatAreNotSummariesAreReported) {
  EXPECT_THAT(problemOf(""), HasSubstr("empty"));
  EXPECT_THAT(problemOf("{}"), HasSubstr("expected an array of messages"));
  EXPECT_THAT(problemOf("7"), HasSubstr("expected an array of messages"));
  EXPECT_THAT(problemOf("[1]"), HasSubstr("a message is not an object"));
  EXPECT_THAT(problemOf("[[]]"), HasSubstr("a message is not an object"));
  EXPECT_THAT(problemOf("[{}]"), HasSubstr("an entry has no message"));
  EXPECT_THAT(problemOf(R"([{"A": 1}])"), HasSubstr("a message is not an object"));
  EXPECT_THAT(problemOf(R"([{"A": []}])"), HasSubstr("a message is not an object"));
  EXPECT_THAT(problemOf(R"([{"A": {}, "B": {}}])"), HasSubstr("more than one message"));
  EXPECT_THAT(problemOf("[{\"A\": {\"b\": \"\xFF\"}}]"), HasSubstr("encoding"));
  EXPECT_THAT(problemOf("[] x"), HasSubstr("line 1, column 4: "));
  EXPECT_THAT(problemOf(R"([{"A": {"b": )" + std::string(100'000, '[')), HasSubstr("too deep"));
}

}  // namespace
}  // namespace halvox::tools
