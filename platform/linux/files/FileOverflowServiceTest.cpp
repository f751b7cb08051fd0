#include "platform/linux/files/FileOverflowService.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::HasSubstr;

constexpr std::size_t kPiece = 64 * 1024;

class FileOverflowServiceTest : public ::testing::Test {
 protected:
  std::optional<Error> write(std::size_t length, OverflowPlace& place) {
    const std::vector<std::byte> bytes(length, std::byte{'a'});
    return service_.write(bytes, place);
  }
  // Finds the unnamed file among the open descriptors of the process.
  [[nodiscard]] std::optional<struct stat> file() const {
    for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
      std::error_code none;  // the iterator's own descriptor is gone
      const std::string target = std::filesystem::read_symlink(entry.path(), none).string();
      struct stat status {};
      if (target.starts_with(directory_.string() + "/") &&
          ::stat(entry.path().c_str(), &status) == 0) {
        return status;
      }
    }
    return std::nullopt;
  }
  std::uint64_t count(const char* name) { return statistics_.counter("overflow", name).value(); }

  const ScratchDirectory scratch_;
  const std::filesystem::path directory_ = scratch_.path() / "made" / "when needed";
  CounterStatisticsService statistics_;
  FileOverflowService service_{{.directory = directory_, .clientMegabytes = 8}, statistics_};
};

TEST_F(FileOverflowServiceTest, MakesNothingUntilItIsNeeded) {
  EXPECT_FALSE(std::filesystem::exists(directory_));
}

TEST_F(FileOverflowServiceTest, LeavesNoNameAndLetsNobodyElseRead) {
  OverflowPlace place;
  ASSERT_EQ(write(kPiece, place), std::nullopt);

  EXPECT_TRUE(std::filesystem::is_empty(directory_));
  ASSERT_TRUE(file().has_value());
  EXPECT_EQ(file()->st_mode & 0777U, 0600U);
}

TEST_F(FileOverflowServiceTest, GivesRoomBackWhileOtherPiecesStay) {
  OverflowPlace kept;
  OverflowPlace released;
  ASSERT_EQ(write(kPiece, kept), std::nullopt);
  ASSERT_EQ(write(16 * kPiece, released), std::nullopt);
  const auto before = file()->st_blocks;

  service_.release(released);

  EXPECT_LE(file()->st_blocks, before / 4);
}

TEST_F(FileOverflowServiceTest, CutsTheFileToNothingWhenAllIsReleased) {
  std::vector<OverflowPlace> places(3);
  for (OverflowPlace& place : places) ASSERT_EQ(write(kPiece, place), std::nullopt);

  for (const OverflowPlace& place : places) service_.release(place);

  EXPECT_EQ(file()->st_size, 0);
  EXPECT_EQ(count("bytes written"), 3 * kPiece);
  EXPECT_EQ(count("bytes released"), 3 * kPiece);
}

TEST_F(FileOverflowServiceTest, AQuarterOfAClientsMemoryMayStayThere) {
  EXPECT_EQ(service_.memoryPerClient(), 2U * 1024 * 1024);
}

TEST_F(FileOverflowServiceTest, SaysWhereItCannotCreateTheFileAndTriesAgain) {
  std::filesystem::create_directories(directory_.parent_path());
  { std::ofstream(directory_) << "not a directory"; }
  OverflowPlace place{.offset = 1, .length = 2};

  const auto error = write(kPiece, place);

  ASSERT_TRUE(error.has_value());
  EXPECT_THAT(error->description, HasSubstr("cannot create a file in " + directory_.string()));
  EXPECT_EQ(place.offset, 1U);
  EXPECT_EQ(place.length, 2U);
  EXPECT_EQ(count("failed"), 1U);
  std::filesystem::remove(directory_);
  EXPECT_EQ(write(kPiece, place), std::nullopt);
}

// A write that reaches the limit on the size of files fails in the middle of a piece, as on a full
// disk.
TEST_F(FileOverflowServiceTest, KeepsNothingOfAPieceThatDoesNotFit) {
  OverflowPlace first;
  ASSERT_EQ(write(kPiece, first), std::nullopt);
  rlimit old{};
  ::getrlimit(RLIMIT_FSIZE, &old);
  const auto oldHandler = ::signal(SIGXFSZ, SIG_IGN);
  const rlimit small{.rlim_cur = kPiece + kPiece / 2, .rlim_max = old.rlim_max};
  ::setrlimit(RLIMIT_FSIZE, &small);
  OverflowPlace second;

  const auto error = write(kPiece, second);

  ::setrlimit(RLIMIT_FSIZE, &old);
  ::signal(SIGXFSZ, oldHandler);
  ASSERT_TRUE(error.has_value());
  EXPECT_THAT(error->description, HasSubstr("File too large"));
  EXPECT_LE(file()->st_blocks * 512, static_cast<long>(kPiece));
  std::vector<std::byte> bytes(kPiece);
  EXPECT_EQ(service_.read(first, bytes), std::nullopt);
  EXPECT_EQ(write(kPiece, second), std::nullopt);
}

}  // namespace
}  // namespace halvox::platform::linux_
