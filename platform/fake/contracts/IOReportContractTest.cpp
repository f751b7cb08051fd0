// The contract of the drivers' counters, run on the fake.

#include "platform/fake/contracts/IOReportContract.h"

#include "platform/fake/FakeIOReportService.h"
#include "platform/fake/Journal.h"

namespace halvox::platform::contract {
namespace {

class FakeIOReportHarness {
 public:
  IOReportService& service() { return service_; }
  void set(const FakeIOReportService::ChannelList& channels) {
    for (const auto& [group, subGroup] : kIOReportGroups) {
      FakeIOReportService::ChannelList chosen;
      for (const auto& channel : channels) {
        if (group.has_value() && channel.group != group) continue;
        if (subGroup.has_value() && channel.subGroup != subGroup) continue;
        chosen.push_back(channel);
      }
      service_.setGroup(group.value_or("(null)") + "-" + subGroup.value_or("(null)"),
                        std::move(chosen));
    }
  }

 private:
  Journal journal_;
  FakeIOReportService service_{journal_};
};

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, IOReportContract, FakeIOReportHarness);

}  // namespace
}  // namespace halvox::platform::contract
