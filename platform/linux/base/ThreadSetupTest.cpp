#include "platform/linux/base/ThreadSetup.h"

#include <algorithm>
#include <array>
#include <csignal>
#include <functional>
#include <string>
#include <string_view>
#include <thread>

#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/resource.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

void onThread(const std::function<void()>& work) { std::jthread(work).join(); }

std::string ownName() {
  std::array<char, 16> name{};
  ::pthread_getname_np(::pthread_self(), name.data(), name.size());
  return name.data();
}

bool isBlocked(int signal) {
  sigset_t blocked;
  ::pthread_sigmask(SIG_BLOCK, nullptr, &blocked);
  return ::sigismember(&blocked, signal) == 1;
}

int ownNiceness() { return ::getpriority(PRIO_PROCESS, static_cast<id_t>(::gettid())); }

std::string nameFor(std::string_view label) {
  std::string name;
  onThread([&] {
    setUpThread(label);
    name = ownName();
  });
  return name;
}

TEST(ThreadSetupTest, NameIsWhatFitsOfTheLabelsEnd) {
  EXPECT_EQ(nameFor("log"), "log");
  EXPECT_EQ(nameFor("fifteen letters"), "fifteen letters");
  EXPECT_EQ(nameFor("com.tarno.halvox.link"), "halvox.link");
  EXPECT_EQ(nameFor("one-word-without-a-dot"), "d-without-a-dot");
}

TEST(ThreadSetupTest, ThreadTakesNoSignals) {
  bool isTermBlocked = false;
  bool isUserBlocked = false;
  onThread([&] {
    setUpThread("test");
    isTermBlocked = isBlocked(SIGTERM);
    isUserBlocked = isBlocked(SIGUSR1);
  });

  EXPECT_TRUE(isTermBlocked);
  EXPECT_TRUE(isUserBlocked);
}

TEST(ThreadSetupTest, PriorityIsLoweredByStepsBelowTheMainThread) {
  const int main = ::getpriority(PRIO_PROCESS, static_cast<id_t>(::getpid()));
  int normal = -1;
  int utility = -1;
  int background = -1;
  onThread([&] {
    setUpThread("test", ThreadPriority::kNormal);
    normal = ownNiceness();
  });
  onThread([&] {
    setUpThread("test", ThreadPriority::kUtility);
    utility = ownNiceness();
  });
  onThread([&] {
    setUpThread("test", ThreadPriority::kBackground);
    background = ownNiceness();
  });

  EXPECT_EQ(normal, main);
  EXPECT_EQ(utility, std::min(main + 5, 19));
  EXPECT_EQ(background, std::min(main + 10, 19));
}

TEST(SignalsBlockedTest, ThreadsCreatedMeanwhileTakeNoSignals) {
  bool isInherited = false;
  {
    const SignalsBlocked blocked;
    EXPECT_TRUE(isBlocked(SIGUSR1));
    onThread([&] { isInherited = isBlocked(SIGUSR1); });
  }

  EXPECT_TRUE(isInherited);
  EXPECT_FALSE(isBlocked(SIGUSR1));
}

}  // namespace
}  // namespace halvox::platform::linux_
