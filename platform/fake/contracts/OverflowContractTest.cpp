// The contract of overflow, run on the fake.

#include "platform/fake/contracts/OverflowContract.h"

#include "platform/fake/FakeOverflowService.h"

namespace halvox::platform::contract {
namespace {

class FakeOverflowHarness {
 public:
  OverflowService& service() { return service_; }

 private:
  FakeOverflowService service_;
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, OverflowContract, FakeOverflowHarness);

}  // namespace halvox::platform::contract
