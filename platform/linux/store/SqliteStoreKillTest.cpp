#include <atomic>
#include <csignal>
#include <string>
#include <thread>
#include <vector>

#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/linux/store/StoreFixture.h"

// Tests what remains of a store whose process was killed under load.

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;

using Clock = std::chrono::steady_clock;
// A process sends at most a thousand events in a millisecond, and these therefore last for at least
// two seconds. The longest time before a kill is 1.1 seconds.
constexpr std::size_t kEventsBetweenPauses = 1000;
constexpr std::size_t kMostEvents = 2'000'000;

// Shared memory. The process that will be killed writes to it, and the test reads it.
struct Progress {
  std::atomic<std::size_t> sent;
  Clock::time_point times[kMostEvents];  // when each send() returned
};

class SqliteStoreKillTest : public StoreFixture {
 protected:
  SqliteStoreKillTest() {
    void* memory = ::mmap(nullptr, sizeof(Progress), PROT_READ | PROT_WRITE,
                          MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    progress_ = static_cast<Progress*>(memory);
  }
  ~SqliteStoreKillTest() override { ::munmap(progress_, sizeof(Progress)); }

  [[noreturn]] void sendUntilKilled() {
    // The half second holds for a process that gets processor time, whatever else runs beside the
    // test. Without the right to raise its priority, the process keeps the one that it has.
    ::setpriority(PRIO_PROCESS, 0, -20);
    if (!open()) ::_exit(1);
    for (std::size_t number = 0; number < kMostEvents; ++number) {
      send(static_cast<std::int64_t>(number));
      progress_->times[number] = Clock::now();
      progress_->sent.store(number + 1, std::memory_order_release);
      if ((number + 1) % kEventsBetweenPauses == 0) {
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
      }
    }
    // The test may be late on a busy machine. The process waits for it.
    while (true) ::pause();
  }

  // Starts a process that sends events, and kills it after `time`. Returns how many of its events
  // were older than half a second at that moment.
  std::size_t killAfter(std::chrono::milliseconds time) {
    progress_->sent = 0;
    const pid_t child = ::fork();
    if (child == 0) sendUntilKilled();
    EXPECT_TRUE(eventually([&] {
      const std::size_t sent = progress_->sent.load(std::memory_order_acquire);
      return sent > 0 && progress_->times[sent - 1] - progress_->times[0] >= time;
    }));
    ::kill(child, SIGKILL);
    const Clock::time_point killed = Clock::now();
    int status = 0;
    ::waitpid(child, &status, 0);
    EXPECT_TRUE(WIFSIGNALED(status)) << "the child ended by itself with " << status;
    const std::size_t sent = progress_->sent.load(std::memory_order_acquire);
    std::size_t old = 0;
    while (old < sent && progress_->times[old] < killed - std::chrono::milliseconds(500)) ++old;
    return old;
  }

  void expectSoundAndComplete(std::size_t atLeast) {
    ASSERT_THAT(rows(database(), "PRAGMA integrity_check"), ElementsAre("ok"));
    const std::vector<std::string> stored = payloads();
    EXPECT_GE(stored.size(), atLeast);
    for (std::size_t number = 0; number < stored.size(); ++number) {
      ASSERT_EQ(stored[number], numbered(static_cast<std::int64_t>(number)));
    }
  }

 private:
  Progress* progress_;
};

TEST_F(SqliteStoreKillTest, LosesAtMostTheEventsOfTheLastHalfSecond) {
  for (const int time : {30, 700, 1100}) {
    std::filesystem::remove_all(options.directory);
    const std::size_t old = killAfter(std::chrono::milliseconds(time));
    if (time > 600) {
      EXPECT_GT(old, 1000U);
    }
    expectSoundAndComplete(old);
  }
}

TEST_F(SqliteStoreKillTest, AKilledStoreOpensAgainAndContinues) {
  killAfter(std::chrono::milliseconds(200));
  const std::size_t before = payloads().size();
  start();
  send(-1);
  stop();
  EXPECT_EQ(payloads().size(), before + 1);
  EXPECT_TRUE(setAsideFiles().empty());
}

}  // namespace
}  // namespace halvox::platform::linux_
