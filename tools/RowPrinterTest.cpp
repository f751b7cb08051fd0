#include "tools/RowPrinter.h"

#include <cstdlib>
#include <ctime>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "tools/TextTable.h"

namespace halvox::tools {
namespace {

class RowPrinterTest : public testing::Test {
 protected:
  RowPrinterTest() {
    setenv("TZ", "XXX-02", 1);
    tzset();
  }

  // Prints rows of a name and its fields, one second apart.
  std::string printed(RowStyle style,
                      const std::vector<std::pair<std::string, std::string>>& rows) {
    std::ostringstream out;
    RowPrinter printer(out, std::move(style));
    double time = 100;
    for (const auto& [name, fields] : rows) {
      std::vector<RowCell> cells{{.text = name, .look = RowCell::Look::kName, .keepsEnd = true},
                                 {.text = fields}};
      printer.print(
          static_cast<std::int64_t>(time), time, [&] { return cells; },
          [] { return std::string("{\"n\":1}"); });
      ++time;
    }
    return out.str();
  }
};

TEST_F(RowPrinterTest, SeparatesColumnsByTwoBlanksIfThereIsNoTerminal) {
  EXPECT_EQ(printed({}, {{"a.b", "x=1"}, {"a.long", "y=2"}}),
            "1970-01-01 02:01:40.000  a.b  x=1\n"
            "1970-01-01 02:01:41.000  a.long  y=2\n");
}

TEST_F(RowPrinterTest, AlignsColumnsAtATerminalAndFitsItsWidth) {
  EXPECT_EQ(printed({.width = 100}, {{"a.long", "x=1"}, {"a.b", std::string(90, 'y')}}),
            "1970-01-01 02:01:40.000  a.long  x=1\n"
            "1970-01-01 02:01:41.000  a.b     " +
                std::string(66, 'y') + "…\n");
}

TEST_F(RowPrinterTest, ShowsTheEndsOfLongNames) {
  const std::string name = "com.tarno.longformaudio.Session_Playback.Start";

  EXPECT_EQ(printed({.width = 80}, {{name, std::string(90, 'y')}}),
            "1970-01-01\n"
            "02:01:40.000  ….longformaudio.Session_Playback.Start  " +
                std::string(25, 'y') + "…\n");
}

TEST_F(RowPrinterTest, ANarrowTerminalGetsTheDateOnALineOfItsOwn) {
  EXPECT_EQ(printed({.width = 40}, {{"Playback.Start", "x=1"}, {"Playback.Stop", "volume=0.25"}}),
            "1970-01-01\n"
            "02:01:40  Playback.Start  x=1\n"
            "02:01:41  Playback.Stop   volume=0.25\n");
  EXPECT_EQ(printed({.width = 60, .isUtc = true}, {{"a", "x=1"}}),
            "1970-01-01 UTC\n"
            "00:01:40.000  a  x=1\n");
}

TEST_F(RowPrinterTest, NoLineIsWiderThanTheTerminal) {
  for (const std::size_t width : {20U, 40U, 59U, 60U, 80U, 99U, 100U, 200U}) {
    std::istringstream lines(
        printed({.width = width},
                {{"com.tarno.longformaudio.Session_Playback.Start", std::string(300, 'x')},
                 {"音楽音楽音楽音楽音楽音楽音楽音楽音楽", "音楽音楽音楽音楽音楽音楽"}}));
    for (std::string line; std::getline(lines, line);) {
      EXPECT_LE(displayWidth(line), width) << line;
    }
  }
}

TEST_F(RowPrinterTest, CutsNothingIfAskedFor) {
  const std::string fields(300, 'x');

  EXPECT_EQ(printed({.width = 40, .isFull = true}, {{"a.b.c", fields}, {"a", "y"}}),
            "1970-01-01 02:01:40.000  a.b.c  " + fields +
                "\n"
                "1970-01-01 02:01:41.000  a      y\n");
}

TEST_F(RowPrinterTest, ShowsTimesInUtcIfAskedFor) {
  EXPECT_EQ(printed({.isUtc = true}, {{"a", "x=1"}}), "1970-01-01 00:01:40.000Z  a  x=1\n");
}

TEST_F(RowPrinterTest, ColoursTakeNoRoom) {
  const std::string text = printed({.width = 50, .hasColour = true}, {{"a", "x=1"}, {"bb", "y=2"}});

  EXPECT_EQ(text,
            "\x1B[2m1970-01-01\x1B[0m\n"
            "\x1B[2m02:01:40\x1B[0m  \x1B[36ma\x1B[0m  x=1\n"
            "\x1B[2m02:01:41\x1B[0m  \x1B[36mbb\x1B[0m  y=2\n");
}

TEST_F(RowPrinterTest, JsonHasTheCursorOfEachRow) {
  EXPECT_EQ(printed({.form = OutputForm::kJson, .command = "events"}, {{"a", "x=1"}}),
            "{\"n\":1,\"cursor\":\"events:100@100\"}\n");
}

TEST_F(RowPrinterTest, KnowsTheLastRow) {
  std::ostringstream out;
  RowPrinter printer(out, {.command = "link"});
  EXPECT_FALSE(printer.last());
  printer.print(
      7, 5.5, [] { return std::vector<RowCell>{}; }, [] { return std::string(); });

  EXPECT_EQ(printer.last(), (RowCursor{"link", 7, 5.5}));
  EXPECT_EQ(printer.rows(), 1U);
}

}  // namespace
}  // namespace halvox::tools
