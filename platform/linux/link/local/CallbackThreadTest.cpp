#include "platform/linux/link/local/CallbackThread.h"

#include <atomic>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/testing/NoThreadsToHave.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

std::ptrdiff_t threads() {
  const std::filesystem::directory_iterator tasks("/proc/self/task");
  return std::distance(begin(tasks), end(tasks));
}

struct CallbackThreadTest : ::testing::Test {
  FakePlatform platform;
  CallbackThread callbacks{platform.dispatch};
};

TEST_F(CallbackThreadTest, CallsInOrderOnAThreadOfItsOwn) {
  std::vector<int> called;
  std::thread::id where;
  callbacks.call([&] { where = std::this_thread::get_id(); });
  for (int number = 0; number < 3; ++number)
    callbacks.call([&, number] { called.push_back(number); });

  callbacks.stop();

  EXPECT_THAT(called, ElementsAre(0, 1, 2));
  EXPECT_NE(where, std::this_thread::get_id());
}

// ThreadSanitizer starts a thread of its own when a program starts its first thread.
void letTheSanitizerStartItsThread() {
  pid_t first = 0;
  std::thread([&] { first = ::gettid(); }).join();
  // The kernel still lists a thread for a moment after it was joined.
  const std::string task = "/proc/self/task/" + std::to_string(first);
  ASSERT_TRUE(eventually([&] { return !std::filesystem::exists(task); }));
}

TEST_F(CallbackThreadTest, HasNoThreadWhileThereIsNothingToCall) {
  ASSERT_NO_FATAL_FAILURE(letTheSanitizerStartItsThread());
  const std::ptrdiff_t before = threads();
  for (int round = 0; round < 3; ++round) {
    std::atomic<bool> isCalled{false};
    callbacks.call([&] { isCalled = true; });
    ASSERT_TRUE(eventually([&] { return isCalled.load(); }));
    EXPECT_TRUE(eventually([&] { return threads() == before; }));
  }
}

TEST_F(CallbackThreadTest, ACallbackMayGiveAnother) {
  std::atomic<bool> isCalled{false};

  callbacks.call([&] { callbacks.call([&] { isCalled = true; }); });

  EXPECT_TRUE(eventually([&] { return isCalled.load(); }));
}

TEST_F(CallbackThreadTest, WithoutAThreadToHaveTheBackgroundQueueCalls) {
  int calls = 0;
  {
    const NoThreadsToHave none;
    callbacks.call([&] { ++calls; });
  }
  EXPECT_EQ(calls, 0);

  platform.dispatch.advance(std::chrono::nanoseconds(0));

  EXPECT_EQ(calls, 1);
}

TEST_F(CallbackThreadTest, DropsWhatComesAfterTheStop) {
  std::vector<int> called;
  callbacks.stop();

  callbacks.call([&] { called.push_back(1); });
  callbacks.stop();

  EXPECT_THAT(called, IsEmpty());
  EXPECT_EQ(platform.dispatch.delayedJobs(), 0U);
}

}  // namespace
}  // namespace halvox::platform::linux_
