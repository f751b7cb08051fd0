// The contract of the real-time framework, run on the fake.

#include "platform/fake/contracts/TlmReportingContract.h"

#include <functional>

#include "platform/fake/FakePlatform.h"

namespace halvox::platform::contract {
namespace {

class FakeHarness {
 public:
  static constexpr bool kFindsBackends = true;
  static constexpr bool kTakesMessages = true;

  FakeHarness() {
    fake().answerDiscoveries(FakeTlmReportingService::Answering::kLater, Array{"server"});
  }
  TLMReportingService& service() { return fake(); }
  bool letRunUntil(const std::function<bool()>& condition) {
    platform_.dispatch.runUntilIdle();
    return condition();
  }
  std::vector<std::int64_t> arrived() {
    std::vector<std::int64_t> numbers;
    for (const auto& sent : {fake().messages(), fake().singleMessages()}) {
      for (const auto& message : sent) numbers.push_back(message.payload.find("n")->toInt64());
    }
    return numbers;
  }
  void breakSending() {
    fake().setOutcome({.sent = false, .error = Error{.description = "no server"}});
  }

 private:
  FakeTlmReportingService& fake() { return platform_.tlmReporting; }

  FakePlatform platform_;
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, TlmReportingContract, FakeHarness);

}  // namespace halvox::platform::contract
