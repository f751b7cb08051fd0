#include "tools/TextTable.h"

#include <sstream>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

std::string printed(const TextTable& table, std::optional<std::size_t> width = std::nullopt) {
  std::ostringstream out;
  table.print(out, width);
  return out.str();
}

TextTable sample() {
  TextTable table({{.heading = "ID", .align = TextTable::Align::kRight},
                   {.heading = "NAME", .least = 4},
                   {.heading = "NOTE", .rank = 1}});
  table.add({"7", "a long name", "first"});
  table.add({"10", "b", "second"});
  return table;
}

TEST(TextTableTest, AlignsItsColumns) {
  EXPECT_EQ(printed(sample()),
            "ID  NAME         NOTE\n"
            " 7  a long name  first\n"
            "10  b            second\n");
}

TEST(TextTableTest, CutsWhatDoesNotFitTheTerminal) {
  EXPECT_EQ(printed(sample(), 20),
            "ID  NAME      NOTE\n"
            " 7  a long …  first\n"
            "10  b         second\n");
}

TEST(TextTableTest, LeavesOutColumnsByRankIfCuttingIsNotEnough) {
  EXPECT_EQ(printed(sample(), 12),
            "ID  NAME\n"
            " 7  a long …\n"
            "10  b\n");
}

TEST(TextTableTest, KeepsTheColumnsWithoutARankWhateverTheWidth) {
  EXPECT_EQ(printed(sample(), 1),
            "ID  NAME\n"
            " 7  a l…\n"
            "10  b\n");
}

TEST(TextTableTest, CutsTheBeginningOfATextIfItsEndMattersMore) {
  EXPECT_EQ(cutToEnd("Playback.Start", 14), "Playback.Start");
  EXPECT_EQ(cutToEnd("Playback.Start", 6), "…Start");
  EXPECT_EQ(cutToEnd("音楽の時間", 6), "…時間");
  EXPECT_EQ(cutToEnd("音楽の時間", 5), "…時間");
  EXPECT_EQ(cutToEnd("abc", 1), "…");
  EXPECT_EQ(cutToEnd("abc", 0), "");
}

TEST(TextTableTest, CountsTheColumnsThatCharactersTake) {
  EXPECT_EQ(displayWidth("abc"), 3U);
  EXPECT_EQ(displayWidth("é"), 1U);
  EXPECT_EQ(displayWidth("e\u0301"), 1U);
  EXPECT_EQ(displayWidth("音楽"), 4U);
  EXPECT_EQ(displayWidth("\xFF"), 1U);
}

TEST(TextTableTest, CutsBetweenCharacters) {
  EXPECT_EQ(cutTo("音楽", 4), "音楽");
  EXPECT_EQ(cutTo("音楽", 3), "音…");
  EXPECT_EQ(cutTo("音楽", 2), "…");
  EXPECT_EQ(cutTo("abc", 0), "");
}

TEST(TextTableTest, WhatIsNotATerminalHasNoWidth) { EXPECT_FALSE(terminalWidth(-1).has_value()); }

}  // namespace
}  // namespace halvox::tools
