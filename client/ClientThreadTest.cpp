#include "client/ClientThread.h"

#include <atomic>
#include <cstddef>

#include <gtest/gtest.h>
#include <pthread.h>

namespace halvox::client {
namespace {

TEST(ClientThreadTest, RunsTheWorkAndWaitsForItsEnd) {
  std::atomic<bool> isCurrent{false};
  std::atomic<bool> started{false};
  {
    ClientThread thread;
    thread.start([&] {
      started.wait(false);
      isCurrent = thread.isCurrent();
    });
    EXPECT_FALSE(thread.isCurrent());
    started = true;
    started.notify_all();
  }

  EXPECT_TRUE(isCurrent);
}

TEST(ClientThreadTest, AThreadThatNeverStartedNeedsNoEnd) {
  const ClientThread thread;

  EXPECT_FALSE(thread.isCurrent());
}

TEST(ClientThreadTest, HasASmallStack) {
  std::atomic<std::size_t> bytes{0};
  {
    ClientThread thread;
    thread.start([&] {
      pthread_attr_t attributes;
      pthread_getattr_np(pthread_self(), &attributes);
      std::size_t size = 0;
      pthread_attr_getstacksize(&attributes, &size);
      pthread_attr_destroy(&attributes);
      bytes = size;
    });
  }

  EXPECT_GT(bytes, 256U * 1024);
  EXPECT_LE(bytes, 1024U * 1024);
}

}  // namespace
}  // namespace halvox::client
