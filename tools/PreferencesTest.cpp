#include "tools/Preferences.h"

#include <filesystem>
#include <fstream>
#include <sstream>

#include <gtest/gtest.h>

#include "client/testing/TestService.h"
#include "tools/CommandLine.h"

namespace halvox::tools {
namespace {

class PreferencesTest : public testing::Test {
 protected:
  // Runs `halvoxctl preferences` with these arguments.
  ExitStatus run(std::vector<std::string> arguments, bool json = false) {
    out_.str("");
    errors_.str("");
    arguments.insert(arguments.begin(), {"preferences", "--directory", directory_});
    std::istringstream none;
    const auto parsed = parseCommandLine(arguments, CommandSource::kArguments, none);
    if (const auto* text = std::get_if<CommandLineText>(&parsed)) {
      errors_ << text->text;
      return text->status;
    }
    return showOrChangePreferences(*std::get<Command>(parsed).asked<Preferences>(), json, out_,
                                   errors_);
  }
  std::string file(const std::string& domain = "d", const std::string& user = "mobile") const {
    return directory_ + "/" + user + "/" + domain + ".toml";
  }
  static std::string read(const std::string& path) {
    std::ifstream stream(path);
    return {std::istreambuf_iterator<char>(stream), {}};
  }
  void write(const std::string& text) const {
    std::filesystem::create_directories(directory_ + "/mobile");
    std::ofstream(file()) << text;
  }

  client::ScratchDirectory scratch_;
  std::string directory_ = scratch_.path("preferences");
  std::ostringstream out_;
  std::ostringstream errors_;
};

TEST_F(PreferencesTest, WhatWasSetIsGot) {
  EXPECT_EQ(run({"set", "com.tarno.halvox", "device_name", "the kitchen"}), ExitStatus::kDone);
  EXPECT_EQ(read(file("com.tarno.halvox")), "device_name = \"the kitchen\"\n");

  EXPECT_EQ(run({"get", "com.tarno.halvox", "device_name"}), ExitStatus::kDone);
  EXPECT_EQ(out_.str(), "the kitchen\n");
}

TEST_F(PreferencesTest, ValuesAreTomlUnlessAStringIsAskedFor) {
  EXPECT_EQ(run({"set", "d", "a", "[1, true]"}), ExitStatus::kDone);
  EXPECT_EQ(run({"set", "d", "b", "7", "--string"}), ExitStatus::kDone);
  EXPECT_EQ(run({"set", "d", "c", "--", "-5"}), ExitStatus::kDone);

  EXPECT_EQ(read(file()), "a = [1, true]\nb = \"7\"\nc = -5\n");
}

TEST_F(PreferencesTest, ADomainIsShownAsLinesOrAsOneObject) {
  write("a = \"x\"\nb = [1]\n");

  EXPECT_EQ(run({"get", "d"}), ExitStatus::kDone);
  EXPECT_EQ(out_.str(), "a = x\nb = [1]\n");
  EXPECT_EQ(run({"get", "d"}, true), ExitStatus::kDone);
  EXPECT_EQ(out_.str(), "{\"a\":\"x\",\"b\":[1]}\n");
  EXPECT_EQ(run({"get", "d", "a"}, true), ExitStatus::kDone);
  EXPECT_EQ(out_.str(), "\"x\"\n");
}

TEST_F(PreferencesTest, AMissingKeyIsStatus1) {
  write("a = 1\n");

  EXPECT_EQ(run({"get", "d", "b"}), ExitStatus::kRefused);
  EXPECT_EQ(errors_.str(), "halvoxctl preferences: \"b\" is not set in \"d\"\n");
  EXPECT_EQ(run({"unset", "d", "b"}), ExitStatus::kRefused);
  EXPECT_EQ(run({"unset", "other", "b"}), ExitStatus::kRefused);
  EXPECT_EQ(read(file()), "a = 1\n");
  EXPECT_FALSE(std::filesystem::exists(file("other")));
}

TEST_F(PreferencesTest, UnsettingKeepsTheRest) {
  write("# one\na = 1\nb = 2 # two\n");

  EXPECT_EQ(run({"unset", "d", "a"}), ExitStatus::kDone);

  EXPECT_EQ(read(file()), "# one\nb = 2 # two\n");
}

TEST_F(PreferencesTest, AnotherUserHasFilesOfTheirOwn) {
  EXPECT_EQ(run({"set", "d", "a", "1", "--user", "root"}), ExitStatus::kDone);

  EXPECT_TRUE(std::filesystem::exists(file("d", "root")));
  EXPECT_EQ(run({"get", "d", "a"}), ExitStatus::kRefused);
}

TEST_F(PreferencesTest, BadArgumentsAreStatus2) {
  EXPECT_EQ(run({"set", "d", "a"}), ExitStatus::kBadArguments);
  EXPECT_EQ(run({"get", "d", "a", "1"}), ExitStatus::kBadArguments);
  EXPECT_EQ(run({"unset", "d"}), ExitStatus::kBadArguments);
  EXPECT_EQ(run({"put", "d", "a", "1"}), ExitStatus::kBadArguments);
  EXPECT_EQ(run({"get", "../d"}), ExitStatus::kBadArguments);
  EXPECT_EQ(run({"get", "d", "--user", ".."}), ExitStatus::kBadArguments);
  EXPECT_EQ(run({"set", "d", "a", "\xff"}), ExitStatus::kBadArguments);
  EXPECT_FALSE(std::filesystem::exists(directory_));
}

TEST_F(PreferencesTest, ABrokenFileIsReportedWithItsPlaceAndNotChanged) {
  write("a =\n");

  EXPECT_EQ(run({"get", "d"}), ExitStatus::kCannotWrite);
  EXPECT_NE(errors_.str().find(file() + ":1:"), std::string::npos);
  EXPECT_EQ(run({"set", "d", "a", "1"}), ExitStatus::kCannotWrite);
  EXPECT_EQ(read(file()), "a =\n");
}

}  // namespace
}  // namespace halvox::tools
