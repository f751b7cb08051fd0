// The contract of diagnostic reporters, run on the fake.

#include "platform/fake/contracts/DiagnosticReporterContract.h"

#include "platform/fake/FakeDiagnosticReporterService.h"

namespace halvox::platform::contract {
namespace {

class FakeHarness {
 public:
  DiagnosticReporterService& service() { return service_; }
  bool letReply(const std::function<bool()>& condition) {
    for (; replied_ < service_.requests().size(); ++replied_) service_.reply(replied_, {});
    return condition();
  }
  void end() {}

 private:
  Journal journal_;
  FakeDiagnosticReporterService service_{journal_};
  std::size_t replied_ = 0;
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, DiagnosticReporterContract, FakeHarness);

}  // namespace halvox::platform::contract
