// Tests the contract of diagnostic reporters on the service that captures snapshots.

#include "platform/fake/contracts/DiagnosticReporterContract.h"

#include <chrono>

#include "platform/linux/diagnostics/SnapshotFixture.h"
#include "platform/linux/testing/Eventually.h"

namespace halvox::platform::contract {
namespace {

// A service that uses fakes and a scratch directory.
class SnapshotHarness : private linux_::SnapshotFixture {
 public:
  SnapshotHarness() { start(); }

  DiagnosticReporterService& service() { return *SnapshotFixture::service; }
  bool letReply(const std::function<bool()>& condition) {
    return linux_::eventually([&] {
      platform.dispatch.advance(std::chrono::milliseconds(1));
      return condition();
    });
  }
  void end() { SnapshotFixture::service->stop(); }

 private:
  void TestBody() override {}
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Snapshot, DiagnosticReporterContract, SnapshotHarness);

}  // namespace halvox::platform::contract
