#include <string>

#include <gtest/gtest.h>

#include "client/testing/TestService.h"
#include "platform/linux/base/ChildProcess.h"

namespace halvox::client {
namespace {

using platform::Array;
using platform::Data;
using platform::Date;

// Runs the C program against this service and returns its exit status.
int runCProgram(const std::string& socketPath) {
  auto child =
      platform::linux_::ChildProcess::start({.command = {HALVOX_C_TEST_PROGRAM, socketPath}});
  return child ? child->wait().status : -1;
}

Value bytes(std::string_view text) { return Data(std::as_bytes(std::span(text))); }

TEST(HalvoxCTest, ACProgramReportsThroughTheSharedLibrary) {
  const ScratchDirectory scratch;
  TestService service(scratch.path("reporting.sock"));

  ASSERT_EQ(runCProgram(scratch.path("reporting.sock")), 0);

  const Dictionary expected{
      {"int64", -5},
      {"uint64", 5},
      {"double", 2.25},
      {"bool", false},
      {"string", "\xC3\xA4"},
      {"data", bytes("xyz")},
      {"date", Date{1e9}},
      {"dictionary", Dictionary{{"inside", 1}}},
      {"array", Array{INT64_MIN, UINT64_MAX, 0.5, true, "text",
                      bytes(std::string_view("\0\xff", 2)), Date{1.5}, Dictionary{}, Array{}}},
  };
  EXPECT_EQ(service.members(),
            "createReportingSession setServiceType setConfiguration startReportingSessionForID "
            "sendMessage sendMessage sendMessage stopReportingSessionForID "
            "destroyReportingSession reporterIDValid");
  const auto calls = service.calls();
  EXPECT_EQ(calls.at(2).arguments.front(), Value(expected));
  EXPECT_EQ(calls.at(4).arguments, (std::vector<Value>{expected, 4, 1, Array{Value(Array{7})}}));
  EXPECT_EQ(calls.at(5).arguments, (std::vector<Value>{expected, 4, 2, Array{Value(Array{7, 8})}}));
  EXPECT_EQ(calls.at(6).arguments, (std::vector<Value>{expected, 14, 18, Array{}}));
}

}  // namespace
}  // namespace halvox::client
