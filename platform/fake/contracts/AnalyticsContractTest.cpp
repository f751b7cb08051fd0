// The contract of analytics, run on the fake.

#include "platform/fake/contracts/AnalyticsContract.h"

#include "platform/fake/FakeAnalyticsService.h"

namespace halvox::platform::contract {
namespace {

class FakeHarness {
 public:
  explicit FakeHarness(const std::vector<std::string>& wanted) {
    service_.wantOnly({wanted.begin(), wanted.end()});
  }
  AnalyticsService& service() { return service_; }
  std::vector<RecordedEvent> recorded() {
    std::vector<RecordedEvent> result;
    for (const FakeAnalyticsService::Event& event : service_.events()) {
      result.emplace_back(event.name, event.payload.value().find("number")->toInt64());
    }
    return result;
  }

 private:
  Journal journal_;
  FakeAnalyticsService service_{journal_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, AnalyticsContract, FakeHarness);

}  // namespace halvox::platform::contract
