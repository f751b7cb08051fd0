#include "platform/linux/base/ErrnoText.h"

#include <cerrno>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

TEST(ErrnoTextTest, IsTheTextOfTheSystem) {
  EXPECT_EQ(errnoText(ENOENT), "No such file or directory");
  EXPECT_EQ(errnoText(EACCES), "Permission denied");
  EXPECT_EQ(errnoText(0), "Success");
}

TEST(ErrnoTextTest, UnknownNumberIsNamed) { EXPECT_EQ(errnoText(9999), "Unknown error 9999"); }

TEST(ErrnoTextTest, LeavesErrnoAsItWas) {
  errno = EAGAIN;

  static_cast<void>(errnoText(9999));

  EXPECT_EQ(errno, EAGAIN);
}

TEST(ErrnoTextTest, ThreadsDoNotSeeEachOthersTexts) {
  constexpr int kThreads = 4;
  constexpr int kFirstUnknown = 5000;
  std::vector<int> wrong(kThreads, 0);
  {
    std::vector<std::jthread> threads;
    for (int thread = 0; thread < kThreads; ++thread) {
      threads.emplace_back([thread, &count = wrong[static_cast<std::size_t>(thread)]] {
        const int number = kFirstUnknown + thread;
        const std::string expected = "Unknown error " + std::to_string(number);
        for (int round = 0; round < 2000; ++round) count += errnoText(number) == expected ? 0 : 1;
      });
    }
  }

  EXPECT_EQ(wrong, std::vector<int>(kThreads, 0));
}

}  // namespace
}  // namespace halvox::platform::linux_
