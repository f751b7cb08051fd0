// The contract of preferences, run on the fake.

#include "platform/fake/contracts/PreferenceContract.h"

#include "platform/fake/FakePreferenceService.h"

namespace halvox::platform::contract {
namespace {

class FakePreferenceHarness {
 public:
  PreferenceService& service() { return service_; }
  void set(const std::string& domain, const std::string& key, const Value& value) {
    service_.set(domain, key, value);
  }
  void remove(const std::string& domain, const std::string& key) { service_.remove(domain, key); }

 private:
  FakePreferenceService service_;
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, PreferenceContract, FakePreferenceHarness);

}  // namespace halvox::platform::contract
