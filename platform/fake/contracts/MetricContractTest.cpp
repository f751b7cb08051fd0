// The contract of metrics, run on the fake.

#include "platform/fake/contracts/MetricContract.h"

#include "platform/fake/FakeMetricService.h"

namespace halvox::platform::contract {
namespace {

class FakeHarness {
 public:
  MetricService& service() { return service_; }
  std::vector<RecordedMetric> recorded() {
    std::vector<RecordedMetric> result;
    for (const auto& [metricID, bytes] : service_.metrics()) {
      std::string text;
      for (const std::byte byte : bytes) text += static_cast<char>(byte);
      result.emplace_back(metricID, std::move(text));
    }
    return result;
  }

 private:
  Journal journal_;
  FakeMetricService service_{journal_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, MetricContract, FakeHarness);

}  // namespace halvox::platform::contract
