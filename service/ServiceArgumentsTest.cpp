#include "service/ServiceArguments.h"

#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox {
namespace {

using testing::HasSubstr;
using Request = ServiceArguments::Request;

ServiceArguments parse(const std::vector<const char*>& arguments) {
  return parseServiceArguments(arguments);
}

TEST(ServiceArgumentsTest, NoArgumentMeansServe) { EXPECT_EQ(parse({}).request, Request::kServe); }

TEST(ServiceArgumentsTest, HelpAndVersionAreKnown) {
  EXPECT_EQ(parse({"--help"}).request, Request::kShowHelp);
  EXPECT_EQ(parse({"-h"}).request, Request::kShowHelp);
  EXPECT_EQ(parse({"--version"}).request, Request::kShowVersion);
}

TEST(ServiceArgumentsTest, TheFirstOfSeveralCounts) {
  EXPECT_EQ(parse({"--version", "--help"}).request, Request::kShowVersion);
}

TEST(ServiceArgumentsTest, AnyOtherIsAMistakeThatNamesIt) {
  for (const char* argument : {"--verbose", "--helpful", "-v", "", "serve"}) {
    const ServiceArguments parsed = parse({"--help", argument});

    EXPECT_EQ(parsed.request, Request::kMistake);
    EXPECT_THAT(parsed.mistake, HasSubstr("'" + std::string(argument) + "'"));
  }
}

TEST(ServiceArgumentsTest, HelpNamesTheOptionsAndTheFileOfSettings) {
  const std::string help = serviceHelp("/somewhere/halvox.toml");

  EXPECT_THAT(help, HasSubstr("--help"));
  EXPECT_THAT(help, HasSubstr("--version"));
  EXPECT_THAT(help, HasSubstr("/somewhere/halvox.toml"));
}

}  // namespace
}  // namespace halvox
