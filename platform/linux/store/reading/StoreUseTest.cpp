#include "platform/linux/store/reading/StoreUse.h"

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kLocks =
    "1: POSIX  ADVISORY  WRITE 812 fe:00:7 0 EOF\n"
    "2: FLOCK  ADVISORY  WRITE 4711 fe:00:131402 0 EOF\n"
    "2: -> FLOCK  ADVISORY  WRITE 4712 fe:00:99 0 EOF\n";

class StoreUseTest : public StoreFixture {};

TEST_F(StoreUseTest, FindsTheLockOfAnInode) {
  EXPECT_TRUE(isLocked(kLocks, 131402));
  // A lock of another kind, one that a process only waits for, and none.
  EXPECT_FALSE(isLocked(kLocks, 7));
  EXPECT_FALSE(isLocked(kLocks, 99));
  EXPECT_FALSE(isLocked("", 7));
  EXPECT_FALSE(isLocked("FLOCK\n2: FLOCK\n\n3: FLOCK  ADVISORY  WRITE 1 x:y:z", 7));
}

TEST_F(StoreUseTest, KnowsWhetherAServiceHasTheStoreOpen) {
  EXPECT_EQ(storeUse(options.directory), StoreUse::kUnknown);
  start();
  EXPECT_EQ(storeUse(options.directory), StoreUse::kServed);
  stop();
  EXPECT_EQ(storeUse(options.directory), StoreUse::kNotServed);
}

}  // namespace
}  // namespace halvox::platform::linux_
