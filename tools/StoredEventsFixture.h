#pragma once

#include <memory>
#include <string>

#include <gtest/gtest.h>

#include "client/testing/TestService.h"
#include "platform/fake/FakePlatform.h"
#include "platform/linux/store/SqliteAnalyticsService.h"
#include "platform/linux/store/SqliteStore.h"

namespace halvox::tools {

// A fixture with a store of its own, in the directory "state" of its scratch directory. The events
// that it stores are one second apart, from 100 seconds after 1970 on.
class StoredEventsFixture : public testing::Test {
 protected:
  StoredEventsFixture() {
    platform::linux_::StoreOptions options;
    options.directory = directory();
    options.retentionDays = 1'000'000;  // these events are old
    store_ = std::make_unique<platform::linux_::SqliteStore>(
        options, platform::linux_::SqliteStore::Environment{platform_.clock, platform_.statistics,
                                                            backpressure_});
    EXPECT_TRUE(store_->open());
    service_ = std::make_unique<platform::linux_::SqliteAnalyticsService>(*store_, platform_.clock);
  }

  // Stores an event and waits until readers see it.
  void store(const std::string& name, const platform::Dictionary& payload) {
    platform_.clock.setCurrentDate({time_++});
    service_->sendAnalyticsEventLazy(name, [payload] { return payload; });
    EXPECT_TRUE(client::eventually([this] { return store_->waiting() == 0; }));
  }

  // The same for a message of the real-time link.
  void storeLink(std::int64_t session, const platform::Dictionary& payload) {
    store_->linkMessages().add(
        {.time = time_,
         .party = std::make_shared<platform::linux_::LinkParty>(
             platform::linux_::LinkParty{session, "com.tarno.halvox", "music_session"}),
         .payload = payload});
    EXPECT_TRUE(client::eventually([this] { return store_->waiting() == 0; }));
  }

  [[nodiscard]] std::string directory() const { return scratch_.path("state"); }

  client::ScratchDirectory scratch_;

 private:
  platform::FakePlatform platform_;
  platform::linux_::Backpressure backpressure_;
  std::unique_ptr<platform::linux_::SqliteStore> store_;
  std::unique_ptr<platform::linux_::SqliteAnalyticsService> service_;
  double time_ = 100;
};

}  // namespace halvox::tools
