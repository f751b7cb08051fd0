// The contract of property lists, run on the fake.

#include "platform/fake/contracts/PropertyListContract.h"

#include "platform/fake/FakePropertyListService.h"

namespace halvox::platform::contract {
namespace {

class FakePropertyListHarness {
 public:
  PropertyListService& service() { return service_; }
  std::string write(const std::string& name, const Value& root) {
    service_.setFile("/" + name, root);
    return "/" + name;
  }
  std::string writeBroken(const std::string& name) {
    service_.setBrokenFile("/" + name);
    return "/" + name;
  }
  std::string missing() { return "/missing"; }

 private:
  FakePropertyListService service_;
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, PropertyListContract, FakePropertyListHarness);

}  // namespace halvox::platform::contract
