#include "platform/linux/store/reading/verify/LogVerifier.h"

#include <filesystem>
#include <string>
#include <vector>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::StartsWith;

constexpr std::size_t kLogHeader = 32;
constexpr std::size_t kFrame = 24 + 8192;

class LogVerifierTest : public StoreFixture {
 protected:
  // A store as a kill leaves it: its files, copied while it was open.
  void SetUp() override {
    start();
    for (std::int64_t number = 0; number < 5; ++number) {
      send(number);
      ASSERT_TRUE(allIsStored());
    }
    const std::filesystem::path copy = scratch.path() / "copy";
    std::filesystem::copy(options.directory, copy);
    stop();
    options.directory = copy;
    log_ = readFile(log());
    ASSERT_GT(log_.size(), kLogHeader + 4 * kFrame);
  }
  [[nodiscard]] std::filesystem::path log() const { return database().native() + "-wal"; }
  [[nodiscard]] std::filesystem::path index() const { return database().native() + "-shm"; }
  [[nodiscard]] std::vector<std::string> verify() const {
    std::vector<std::string> found;
    Differences differences([&](const StoreDifference& difference) {
      found.push_back(difference.place + ": " + difference.what);
    });
    verifyLog(database(), differences);
    return found;
  }
  [[nodiscard]] std::string place(std::size_t offset) const {
    return log().native() + ", offset " + std::to_string(offset) + ": ";
  }

  std::string log_;
};

TEST_F(LogVerifierTest, ALogOfAKilledStoreIsInOrder) {
  EXPECT_THAT(verify(), IsEmpty());
  // Without the index it is still in order.
  std::filesystem::remove(index());
  EXPECT_THAT(verify(), IsEmpty());
}

TEST_F(LogVerifierTest, AStoreWithoutALogIsInOrder) {
  std::filesystem::remove(log());
  std::filesystem::remove(index());
  EXPECT_THAT(verify(), IsEmpty());
}

TEST_F(LogVerifierTest, AFrameThatWasBeingWrittenIsInOrder) {
  writeFile(log(), log_ + log_.substr(kLogHeader, 1000));
  EXPECT_THAT(verify(), IsEmpty());
}

TEST_F(LogVerifierTest, FindsALogThatWasCutBetweenFrames) {
  const std::size_t length = kLogHeader + 2 * kFrame;
  writeFile(log(), log_.substr(0, length));
  EXPECT_THAT(verify(), ElementsAre(StartsWith(place(length) + "frame 3 is missing")));
}

TEST_F(LogVerifierTest, FindsALogThatWasCutWithinAFrame) {
  const std::size_t length = kLogHeader + 2 * kFrame;
  writeFile(log(), log_.substr(0, length + 100));
  EXPECT_THAT(verify(), ElementsAre(StartsWith(place(length) + "frame 3 is missing")));
}

TEST_F(LogVerifierTest, FindsALogWithoutItsHeader) {
  writeFile(log(), "");
  EXPECT_THAT(verify(), ElementsAre(StartsWith(place(0))));
}

TEST_F(LogVerifierTest, FindsAFlippedBitInAFrame) {
  const std::size_t frame = kLogHeader + kFrame;
  log_[frame + 500] = static_cast<char>(log_[frame + 500] ^ 1);
  writeFile(log(), log_);
  EXPECT_THAT(verify(), ElementsAre(StartsWith(place(frame) + "frame 2 has a wrong checksum")));
  // The right frames after it show the damage even without the index.
  std::filesystem::remove(index());
  EXPECT_THAT(verify(), ElementsAre(HasSubstr("frame 2 has a wrong checksum")));
}

}  // namespace
}  // namespace halvox::platform::linux_
