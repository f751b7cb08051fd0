#include "tools/top/TopLayout.h"

#include <algorithm>
#include <string>
#include <utility>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/TextTable.h"

namespace halvox::tools {
namespace {

using testing::AllOf;
using testing::Each;
using testing::Field;
using testing::HasSubstr;
using testing::Not;
using testing::SizeIs;
using testing::StartsWith;

TopStream stream(std::string application, std::uint64_t xruns = 0) {
  TopStream made;
  made.application = std::move(application);
  made.service = "longformaudio";
  made.device = "Speakers";
  made.direction = analysis::StreamDirection::kPlayback;
  made.volume = 0.5;
  made.state = TopStreamState::kRunning;
  made.xruns = xruns;
  made.lostMilliseconds = static_cast<double>(xruns) * 2;
  return made;
}

TopSnapshot snapshotOf(std::size_t streams) {
  TopSnapshot snapshot;
  snapshot.time = 1'000'000;
  snapshot.service.isConnected = true;
  snapshot.service.clients = 4;
  snapshot.service.messagesPerSecond = 120.4;
  snapshot.losses = {{.piece = "link local", .reason = "dropped: disk full", .total = 12}};
  snapshot.devices = {{.name = "speaker",
                       .description = "Speakers",
                       .quantum = 256,
                       .rate = 48'000,
                       .busy = 0.123,
                       .xruns = 3,
                       .streams = 1}};
  for (std::size_t number = 0; number < streams; ++number) {
    snapshot.streams.push_back(stream("app" + std::to_string(number), number == 0 ? 3 : 0));
  }
  return snapshot;
}

std::string textOf(const std::vector<TopLine>& lines) {
  std::string text;
  for (const TopLine& line : lines) text += line.text + "\n";
  return text;
}

TEST(TopLayoutTest, AScreenHasServiceLossesDevicesStreamsAndKeys) {
  TopChoice choice;
  const auto lines = layOut(snapshotOf(3), choice, {.columns = 80, .lines = 24});

  EXPECT_THAT(lines, SizeIs(24));
  const std::string text = textOf(lines);
  EXPECT_THAT(text, AllOf(HasSubstr("clients 4"), HasSubstr("messages 120/s"),
                          HasSubstr("link local, dropped: disk full 12"), HasSubstr("12.3%"),
                          HasSubstr("app2"), HasSubstr("3 (6.0 ms)")));
  EXPECT_THAT(lines.back().text, StartsWith("q quit  p pause  ? help  s sort: xruns"));
}

TEST(TopLayoutTest, NoLineIsWiderThanTheScreen) {
  TopSnapshot snapshot = snapshotOf(5);
  snapshot.streams[1] = stream(std::string(1000, 'x') + "\x1b[2J\xE2\x80\xAE");
  for (int part = 0; part < 300; ++part) snapshot.streams[2].application += "\U0001F3B5漢e\u0301";
  for (const TopSize size : {TopSize{40, 12}, TopSize{80, 24}, TopSize{200, 60}}) {
    TopChoice choice;
    const auto lines = layOut(snapshot, choice, size);
    ASSERT_THAT(lines, SizeIs(size.lines));
    for (const TopLine& line : lines) {
      EXPECT_LE(displayWidth(line.text), size.columns) << line.text;
      EXPECT_THAT(line.text, AllOf(Not(HasSubstr("\x1b")), Not(HasSubstr("\xE2\x80\xAE"))));
    }
  }
}

TEST(TopLayoutTest, ASmallScreenStillShowsStreams) {
  TopChoice choice;
  const std::string text = textOf(layOut(snapshotOf(20), choice, {.columns = 40, .lines = 12}));

  EXPECT_THAT(text, AllOf(HasSubstr("Speakers"), HasSubstr("app0"), HasSubstr("running")));
}

TEST(TopLayoutTest, AnySizeHasALayout) {
  for (std::size_t lines = 0; lines < 30; ++lines) {
    for (const std::size_t columns : {0U, 1U, 5U, 20U, 300U}) {
      TopChoice choice;
      EXPECT_LE(layOut(snapshotOf(9), choice, {.columns = columns, .lines = lines}).size(), lines);
    }
  }
}

TEST(TopLayoutTest, StreamsWithXrunsStandOut) {
  TopChoice choice;
  const auto lines = layOut(snapshotOf(2), choice, {.columns = 80, .lines = 24});

  const auto styleOf = [&](const char* text) {
    return std::ranges::find_if(lines,
                                [&](const TopLine& line) { return line.text.starts_with(text); })
        ->style;
  };
  EXPECT_EQ(styleOf("app0"), TopStyle::kAlert);
  EXPECT_EQ(styleOf("app1"), TopStyle::kPlain);
}

TEST(TopLayoutTest, OnlyWhatIsBeingLostStandsOut) {
  TopSnapshot snapshot = snapshotOf(1);
  snapshot.losses = {
      {.piece = "session", .reason = "suppressed: redundant", .total = 9, .perSecond = 5},
      {.piece = "log", .reason = "dropped: reader too slow", .total = 9, .perSecond = 0},
      {.piece = "store", .reason = "dropped: disk full", .total = 9, .perSecond = 5}};
  TopChoice choice;
  const auto lines = layOut(snapshot, choice, {.columns = 80, .lines = 24});

  std::string alerts;
  for (const TopLine& line : lines) {
    if (line.style == TopStyle::kAlert && line.text.find("ped: ") != std::string::npos) {
      alerts += line.text;
    }
  }
  EXPECT_EQ(alerts, "store, dropped: disk full 9 (+5.0/s)");
  EXPECT_THAT(textOf(lines), HasSubstr("session, suppressed: redundant 9 (+5.0/s)"));
}

TEST(TopLayoutTest, ScrollingEndsAtTheLastStream) {
  TopChoice choice;
  EXPECT_TRUE(onKey({.kind = TopKey::Kind::kEnd}, 10, choice));

  const auto lines = layOut(snapshotOf(100), choice, {.columns = 80, .lines = 24});

  EXPECT_THAT(lines[lines.size() - 2].text, StartsWith("app99"));
  EXPECT_LT(choice.firstStream, 100U);
  EXPECT_TRUE(onKey({.kind = TopKey::Kind::kHome}, 10, choice));
  EXPECT_EQ(choice.firstStream, 0U);
}

TEST(TopLayoutTest, TheHelpFitsASmallScreen) {
  TopChoice choice{.showsHelp = true};
  const auto lines = layOut(snapshotOf(3), choice, {.columns = 40, .lines = 60});

  EXPECT_THAT(textOf(lines), AllOf(HasSubstr("quit"), HasSubstr("QUANTUM")));
  for (const TopLine& line : lines) EXPECT_LE(displayWidth(line.text), 40U) << line.text;
}

TopKey key(char character) { return {.kind = TopKey::Kind::kCharacter, .character = character}; }

TEST(TopKeysTest, KeysChoose) {
  TopChoice choice;

  EXPECT_TRUE(onKey(key('p'), 10, choice));
  EXPECT_TRUE(choice.isPaused);
  EXPECT_TRUE(onKey(key(' '), 10, choice));
  EXPECT_FALSE(choice.isPaused);
  EXPECT_TRUE(onKey(key('s'), 10, choice));
  EXPECT_EQ(choice.sort.key, TopSortKey::kApplication);
  EXPECT_TRUE(onKey(key('r'), 10, choice));
  EXPECT_TRUE(choice.sort.isReversed);
  EXPECT_TRUE(onKey(key('v'), 10, choice));
  EXPECT_EQ(choice.sort.key, TopSortKey::kVolume);
  EXPECT_FALSE(onKey(key('q'), 10, choice));
  EXPECT_FALSE(onKey({.kind = TopKey::Kind::kClosed}, 10, choice));
}

TEST(TopKeysTest, AnyKeyLeavesTheHelp) {
  TopChoice choice;
  EXPECT_TRUE(onKey(key('?'), 10, choice));
  EXPECT_TRUE(choice.showsHelp);

  EXPECT_TRUE(onKey({.kind = TopKey::Kind::kNone}, 10, choice));
  EXPECT_TRUE(onKey({.kind = TopKey::Kind::kResized}, 10, choice));
  EXPECT_TRUE(choice.showsHelp);
  EXPECT_TRUE(onKey(key('p'), 10, choice));
  EXPECT_FALSE(choice.showsHelp);
  EXPECT_FALSE(choice.isPaused);
}

TEST(TopSortTest, TheMostXrunsComeFirstAndEqualStreamsByTheirStart) {
  TopSnapshot snapshot;
  snapshot.streams = {stream("late"), stream("early"), stream("bad", 4)};
  snapshot.streams[0].started = 5;
  snapshot.streams[1].started = 3;

  const auto names = [&](const TopSort& sort) {
    sortSnapshot(snapshot, sort);
    std::string text;
    for (const TopStream& one : snapshot.streams) text += one.application + " ";
    return text;
  };
  EXPECT_EQ(names({}), "bad early late ");
  EXPECT_EQ(names({.isReversed = true}), "early late bad ");
  EXPECT_EQ(names({.key = TopSortKey::kApplication}), "bad early late ");
  EXPECT_EQ(names({.key = TopSortKey::kStarted}), "late early bad ");
}

TEST(TopSortTest, EveryKeyHasANameAndFollowsAnother) {
  TopSortKey key = TopSortKey::kXruns;
  for (int count = 0; count < 5; ++count) {
    EXPECT_EQ(sortKeyOf(sortName(key)), key);
    key = nextSortKey(key);
  }
  EXPECT_EQ(key, TopSortKey::kXruns);
  EXPECT_FALSE(sortKeyOf("colour"));
}

}  // namespace
}  // namespace halvox::tools
