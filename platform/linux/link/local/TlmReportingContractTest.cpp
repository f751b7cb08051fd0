// Runs the contract suite of the real-time framework on the adapters of this folder.

#include "platform/fake/contracts/TlmReportingContract.h"

#include <functional>
#include <memory>
#include <string>

#include "platform/linux/link/local/CallbackThread.h"
#include "platform/linux/link/local/LocalTlmReportingService.h"
#include "platform/linux/link/local/NoneTlmReportingService.h"
#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::contract {
namespace {

class LocalHarness : private linux_::StoreFixture {
 public:
  static constexpr bool kFindsBackends = true;
  static constexpr bool kTakesMessages = true;

  LocalHarness() {
    start();
    link_ = std::make_unique<linux_::LocalTlmReportingService>(*store, platform.clock, callbacks_);
  }
  TLMReportingService& service() { return *link_; }
  static bool letRunUntil(const std::function<bool()>& condition) {
    return linux_::eventually(condition);
  }
  std::vector<std::int64_t> arrived() {
    std::vector<std::int64_t> numbers;
    for (const std::string& row :
         linux_::rows(database(), "SELECT json_extract(payload, '$.n') FROM link_messages")) {
      numbers.push_back(std::stoll(row));
    }
    return numbers;
  }
  void breakSending() { store->close(); }

 private:
  void TestBody() override {}

  linux_::CallbackThread callbacks_{platform.dispatch};
  std::unique_ptr<linux_::LocalTlmReportingService> link_;
};

class NoneHarness {
 public:
  static constexpr bool kFindsBackends = false;
  static constexpr bool kTakesMessages = false;

  TLMReportingService& service() { return link_; }
  static bool letRunUntil(const std::function<bool()>& condition) {
    return linux_::eventually(condition);
  }
  static std::vector<std::int64_t> arrived() { return {}; }
  static void breakSending() {}

 private:
  FakePlatform platform_;
  linux_::CallbackThread callbacks_{platform_.dispatch};
  linux_::NoneTlmReportingService link_{platform_.statistics, callbacks_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Local, TlmReportingContract, LocalHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(None, TlmReportingContract, NoneHarness);

}  // namespace halvox::platform::contract
