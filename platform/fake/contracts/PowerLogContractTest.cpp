// The contract of the power log, run on the fake.

#include "platform/fake/contracts/PowerLogContract.h"

#include "platform/fake/FakePowerLogService.h"

namespace halvox::platform::contract {
namespace {

class FakeHarness {
 public:
  PowerLogService& service() { return service_; }
  std::vector<RecordedPowerEvent> recorded() {
    std::vector<RecordedPowerEvent> result;
    for (const FakePowerLogService::Event& event : service_.events()) {
      const Dictionary payload = event.recorded();
      const auto number = [&payload](const char* key) -> std::optional<std::int64_t> {
        const Value* value = payload.find(key);
        return value == nullptr ? std::nullopt : std::optional(value->toInt64());
      };
      result.push_back({event.categoryID, event.name, number("a"), number("b")});
    }
    return result;
  }

 private:
  Journal journal_;
  FakePowerLogService service_{journal_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, PowerLogContract, FakeHarness);

}  // namespace halvox::platform::contract
