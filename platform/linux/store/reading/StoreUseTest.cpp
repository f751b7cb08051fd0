#include "platform/linux/store/reading/StoreUse.h"

#include <unistd.h>

#include "platform/linux/base/ProcessStat.h"
#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kLocks =
    "1: POSIX  ADVISORY  WRITE 812 fe:00:7 0 EOF\n"
    "2: FLOCK  ADVISORY  WRITE 4711 fe:00:131402 0 EOF\n"
    "2: -> FLOCK  ADVISORY  WRITE 4712 fe:00:99 0 EOF\n";

class StoreUseTest : public StoreFixture {};

TEST_F(StoreUseTest, FindsTheLockOfAnInode) {
  EXPECT_EQ(lockHolder(kLocks, 131402), 4711);
  // A lock of another kind, one that a process only waits for, and none.
  EXPECT_EQ(lockHolder(kLocks, 7), std::nullopt);
  EXPECT_EQ(lockHolder(kLocks, 99), std::nullopt);
  EXPECT_EQ(lockHolder("", 7), std::nullopt);
  EXPECT_EQ(lockHolder("FLOCK\n2: FLOCK\n\n3: FLOCK  ADVISORY  WRITE 1 x:y:z", 7), std::nullopt);
}

TEST_F(StoreUseTest, KnowsWhetherAServiceHasTheStoreOpen) {
  EXPECT_EQ(storeServer(options.directory).use, StoreUse::kUnknown);
  start();
  EXPECT_EQ(storeServer(options.directory).use, StoreUse::kServed);
  // In this test the service is this process.
  const auto own = readOwnProcessStat();
  ASSERT_TRUE(own.has_value());
  EXPECT_EQ(storeServer(options.directory).start,
            static_cast<double>(own->startTicks) / static_cast<double>(::sysconf(_SC_CLK_TCK)));
  stop();
  EXPECT_EQ(storeServer(options.directory).use, StoreUse::kNotServed);
}

}  // namespace
}  // namespace halvox::platform::linux_
