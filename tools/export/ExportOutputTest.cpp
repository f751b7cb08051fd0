#include "tools/export/ExportOutput.h"

#include <array>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>
#include <thread>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "client/testing/TestService.h"

namespace halvox::tools {
namespace {

using Existing = NewFile::Existing;

std::string contentOf(const std::string& path) {
  std::ifstream file(path);
  return {std::istreambuf_iterator<char>(file), {}};
}

TEST(ExportOutputTest, AStreamGetsEverything) {
  std::ostringstream stream;
  const auto output = makeStreamOutput(stream);
  EXPECT_TRUE(output->write("a"));
  EXPECT_TRUE(output->write("b"));
  EXPECT_TRUE(output->finish());
  EXPECT_EQ(stream.str(), "ab");
}

TEST(ExportOutputTest, AStreamThatFailsIsAnError) {
  std::ostringstream stream;
  stream.setstate(std::ios::badbit);
  const auto output = makeStreamOutput(stream);
  EXPECT_FALSE(output->write("a"));
  EXPECT_FALSE(output->finish());
}

TEST(ExportOutputTest, AFileHasItsNameOnlyWhenItIsComplete) {
  const client::ScratchDirectory scratch;
  const std::string path = scratch.path("records");
  const auto output = makeFileOutput(path, Existing::kAnError);
  EXPECT_TRUE(output->write("a"));
  EXPECT_FALSE(std::filesystem::exists(path));
  EXPECT_TRUE(output->finish());
  EXPECT_EQ(contentOf(path), "a");
}

TEST(ExportOutputTest, AFileWithoutContentIsMade) {
  const client::ScratchDirectory scratch;
  EXPECT_TRUE(makeFileOutput(scratch.path("empty"), Existing::kAnError)->finish());
  EXPECT_TRUE(std::filesystem::exists(scratch.path("empty")));
}

TEST(ExportOutputTest, AFileThatAppearedMeanwhileIsKept) {
  const client::ScratchDirectory scratch;
  const std::string path = scratch.path("records");
  const auto output = makeFileOutput(path, Existing::kAnError);
  EXPECT_TRUE(output->write("a"));
  std::ofstream(path) << "other";
  const auto finished = output->finish();
  ASSERT_FALSE(finished);
  EXPECT_EQ(finished.error().message, path + ": File exists");
  EXPECT_EQ(contentOf(path), "other");
}

TEST(ExportOutputTest, APipeStaysAPipe) {
  const client::ScratchDirectory scratch;
  const std::string path = scratch.path("pipe");
  ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);
  std::string read;
  std::thread reader([&] { read = contentOf(path); });
  {
    const auto output = makeFileOutput(path, Existing::kAnError);
    EXPECT_TRUE(output->write("through"));
    EXPECT_TRUE(output->finish());
  }
  reader.join();
  EXPECT_EQ(read, "through");
  EXPECT_TRUE(std::filesystem::is_fifo(path));
}

TEST(ExportOutputTest, AFullDeviceIsAnError) {
  const auto output = makeFileOutput("/dev/full", Existing::kAnError);
  const auto written = output->write("a");
  ASSERT_FALSE(written);
  EXPECT_EQ(written.error().message, "/dev/full: No space left on device");
}

}  // namespace
}  // namespace halvox::tools
