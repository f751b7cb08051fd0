#include "tools/export/ExportProgress.h"

#include <sstream>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

using Shown = ExportProgress::Shown;

void read(ExportProgress& progress, int records) {
  for (int record = 0; record < records; ++record) progress.onRecord(1'700'000'000);
}

TEST(ExportProgressTest, ATerminalShowsALineUntilTheEnd) {
  std::ostringstream out;
  ExportProgress progress(out, Shown::kAtTerminal);
  read(progress, 10'000);
  EXPECT_EQ(out.str().find("\r\x1b[K4096 records read, until 2023-11-1"), 0U) << out.str();
  progress.clear();
  EXPECT_TRUE(out.str().ends_with("\r\x1b[K"));
  const auto length = out.str().size();
  progress.clear();
  EXPECT_EQ(out.str().size(), length);
}

TEST(ExportProgressTest, ElsewhereItIsSilent) {
  std::ostringstream out;
  ExportProgress progress(out, Shown::kNever);
  read(progress, 10'000);
  progress.clear();
  EXPECT_EQ(out.str(), "");
}

TEST(ExportProgressTest, AFewRecordsAreNotWorthALine) {
  std::ostringstream out;
  ExportProgress progress(out, Shown::kAtTerminal);
  read(progress, 100);
  progress.clear();
  EXPECT_EQ(out.str(), "");
}

}  // namespace
}  // namespace halvox::tools
