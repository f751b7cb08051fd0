// Runs the contract suite of the link's spool on the fake and on the store.

#include "platform/linux/store/spool/testing/LinkSpoolContract.h"

#include <atomic>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/store/spool/SqliteLinkSpool.h"
#include "platform/linux/store/spool/testing/FakeLinkSpool.h"

namespace halvox::platform::linux_ {
namespace {

class FakeSpoolHarness {
 public:
  FakeSpoolHarness() {
    spool_.onStored([this] { ++stored_; });
  }
  LinkSpool& spool() { return spool_; }
  static bool settle() { return true; }
  void close() { spool_.close(); }
  [[nodiscard]] int stored() const { return stored_; }

 private:
  FakeLinkSpool spool_;
  int stored_ = 0;
};

class StoreSpoolHarness {
 public:
  StoreSpoolHarness() {
    EXPECT_TRUE(store_.open());
    spool_.onStored([this] { ++stored_; });
  }
  LinkSpool& spool() { return spool_; }
  bool settle() {
    return eventually([this] { return !spool_.hasUnstored(); });
  }
  void close() { store_.close(); }
  [[nodiscard]] int stored() const { return stored_; }

 private:
  ScratchDirectory scratch_;
  FakePlatform platform_;
  Backpressure backpressure_;
  std::atomic<int> stored_{0};
  SqliteStore store_{{.directory = scratch_.path() / "store"},
                     {platform_.clock, platform_.statistics, backpressure_}};
  SqliteLinkSpool spool_{store_};
};

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, LinkSpoolContract, FakeSpoolHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Store, LinkSpoolContract, StoreSpoolHarness);

}  // namespace
}  // namespace halvox::platform::linux_
