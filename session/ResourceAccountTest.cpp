#include "session/ResourceAccount.h"

#include <memory>
#include <utility>

#include <gtest/gtest.h>

namespace halvox {
namespace {

TEST(ResourceChargeTest, IsChargedAsLongAsItOrACopyLives) {
  const auto account = std::make_shared<ResourceAccount>();
  {
    ResourceCharge charge(account, 100);
    EXPECT_EQ(account->use().bytes, 100U);
    ResourceCharge copy = charge;
    EXPECT_EQ(account->use().bytes, 200U);
    const ResourceCharge moved = std::move(charge);
    EXPECT_EQ(account->use().bytes, 200U);
    copy = ResourceCharge(account, 7);
    EXPECT_EQ(account->use().bytes, 107U);
  }

  EXPECT_EQ(account->use().bytes, 0U);
}

TEST(ResourceTallyTest, ChargesWhatIsHeldAndGivesItBackAtItsEnd) {
  const auto account = std::make_shared<ResourceAccount>();
  {
    ResourceTally held;
    held.chargeTo(account);
    held.change(0, 100);
    held.change(0, 7);
    EXPECT_EQ(account->use().bytes, 107U);
    held.change(100, 40);
    EXPECT_EQ(account->use().bytes, 47U);
  }

  EXPECT_EQ(account->use().bytes, 0U);
}

TEST(ResourceTallyTest, WithoutAnAccountChargesNobody) {
  ResourceTally held;
  held.change(0, 100);

  const auto account = std::make_shared<ResourceAccount>();
  held.chargeTo(account);

  EXPECT_EQ(account->use().bytes, 0U);
}

}  // namespace
}  // namespace halvox
