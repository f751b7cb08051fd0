#include "platform/linux/drivers/alsa/AlsaSource.h"

#include <fstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/drivers/testing/MadeReadings.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

using namespace std::chrono_literals;
using ::testing::Contains;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;
using testing::samplesOf;
using ::testing::SizeIs;
using ::testing::StartsWith;

// A fixture with a copy of a recorded tree and a clock that the test sets.
class AlsaSourceTest : public ::testing::Test {
 protected:
  void use(const char* tree) {
    std::filesystem::copy(std::filesystem::path(HALVOX_ALSA_TESTDATA) / tree, root_.path(),
                          std::filesystem::copy_options::recursive);
  }
  void write(const std::string& file, const std::string& text) {
    std::ofstream(root_.path() / file) << text;
  }
  void writeStatus(const std::string& pcm, const std::string& state, std::uint64_t hardware,
                   std::uint64_t application, int owner = 1411) {
    write("proc/asound/" + pcm + "/sub0/status",
          "state: " + state + "\nowner_pid   : " + std::to_string(owner) +
              "\ntrigger_time: 1.0\n-----\nhw_ptr      : " + std::to_string(hardware) +
              "\nappl_ptr    : " + std::to_string(application) + "\n");
  }
  // A second card of the same model, in another socket.
  void addTwinOfUsbCard() {
    for (const char* folder : {"proc/asound/", "sys/class/sound/"}) {
      std::filesystem::copy(root_.path() / folder / "card1", root_.path() / folder / "card2",
                            std::filesystem::copy_options::recursive);
    }
    write("proc/asound/cards",
          " 1 [Interface      ]: USB-Audio - Scarlet Two\n"
          "                      Maker Scarlet Two at usb-0000:00:14.0-2, high speed\n"
          " 2 [Interface_1    ]: USB-Audio - Scarlet Two\n"
          "                      Maker Scarlet Two at usb-0000:00:14.0-3, high speed\n");
  }
  std::vector<std::string> show() { return testing::describe(samplesOf(source_.read())); }
  std::vector<std::string> change(const std::function<void()>& act) {
    const auto before = source_.read();
    act();
    return testing::describe(*makeDelta(samplesOf(before), samplesOf(source_.read())));
  }

  ScratchDirectory root_;
  AlsaSource::Clock::time_point now_{100s};
  AlsaSource source_{root_.path(), [this] { return now_; }};
};

TEST_F(AlsaSourceTest, AnAnalogueCodecHasPlaybackCaptureAndPower) {
  use("analogue");

  EXPECT_THAT(
      show(),
      ElementsAre("HDA Intel PCH/Rx/ALC269VC Analog/frames frames = 0",
                  "HDA Intel PCH/Rx/ALC269VC Analog/application frames frames = 0",
                  "HDA Intel PCH/Rx/ALC269VC Analog/state us =",
                  "HDA Intel PCH/Tx/ALC269VC Analog/frames frames = 1474560",
                  "HDA Intel PCH/Tx/ALC269VC Analog/application frames frames = 1490944",
                  "HDA Intel PCH/Tx/ALC269VC Analog/state us =",
                  "HDA Intel PCH/StateTransitionTimes_ms/Runtime/power ms = active:0:360120 "
                  "suspended:0:1840"));
}

TEST_F(AlsaSourceTest, DevicesOfOneNameOnAUsbCardAreDistinguished) {
  use("usb");

  EXPECT_THAT(
      show(),
      ElementsAre(
          "Scarlet Two/Rx/USB Audio/frames frames = 48000",
          "Scarlet Two/Rx/USB Audio/application frames frames = 47000",
          "Scarlet Two/Rx/USB Audio/state us =", "Scarlet Two/Tx/USB Audio/frames frames = 96000",
          "Scarlet Two/Tx/USB Audio/application frames frames = 97024",
          "Scarlet Two/Tx/USB Audio/state us =", "Scarlet Two/Tx/USB Audio 2/frames frames = 0",
          "Scarlet Two/Tx/USB Audio 2/application frames frames = 0",
          "Scarlet Two/Tx/USB Audio 2/state us =",
          "Scarlet Two/StateTransitionTimes_ms/Runtime/power ms = "
          "active:0:98000"));
}

TEST_F(AlsaSourceTest, AnHdmiCardHasAllItsOutputsAndSubstreams) {
  use("hdmi");

  const auto lines = show();

  EXPECT_THAT(lines, SizeIs(13));
  EXPECT_THAT(lines,
              ::testing::IsSupersetOf({"HDA ATI HDMI/Tx/HDMI 0/frames frames = 0",
                                       "HDA ATI HDMI/Tx/HDMI 2/frames frames = 0",
                                       "HDA ATI HDMI/Tx/HDMI 2/frames 1 frames = 0",
                                       "HDA ATI HDMI/StateTransitionTimes_ms/Runtime/power ms = "
                                       "active:0:2210 suspended:0:900400"}));
}

TEST_F(AlsaSourceTest, PlaybackIsCountedInFramesAndTimeInStates) {
  use("analogue");

  const auto lines = change([this] {
    now_ += 2s;
    writeStatus("card0/pcm0p", "RUNNING", 1'474'560 + 96'000, 1'490'944 + 95'000);
  });

  EXPECT_EQ(lines[3], "HDA Intel PCH/Tx/ALC269VC Analog/frames frames = 96000");
  EXPECT_EQ(lines[4], "HDA Intel PCH/Tx/ALC269VC Analog/application frames frames = 95000");
  EXPECT_EQ(lines[5], "HDA Intel PCH/Tx/ALC269VC Analog/state us = RUNNING:0:2000000");
}

TEST_F(AlsaSourceTest, FramesGoOnWhenTheStreamIsPreparedAnew) {
  use("analogue");

  const auto lines = change([this] {
    writeStatus("card0/pcm0p", "RUNNING", 1'474'560 + 1000, 1'490'944 + 1000);
    static_cast<void>(source_.read());
    writeStatus("card0/pcm0p", "RUNNING", 400, 600);
  });

  EXPECT_THAT(lines, ::testing::IsSupersetOf(
                         {"HDA Intel PCH/Tx/ALC269VC Analog/frames frames = 1400",
                          "HDA Intel PCH/Tx/ALC269VC Analog/application frames frames = 1600"}));
}

TEST_F(AlsaSourceTest, FramesOfANewOwnerCountFromZeroEvenWhenThereAreMore) {
  use("usb");

  const auto lines =
      change([this] { writeStatus("card1/pcm0p", "RUNNING", 100'000, 101'000, 3003); });

  EXPECT_THAT(lines, Contains("Scarlet Two/Tx/USB Audio/frames frames = 100000"));
}

TEST_F(AlsaSourceTest, AnXrunIsATransition) {
  use("analogue");

  const auto lines = change([this] {
    now_ += 1s;
    writeStatus("card0/pcm0p", "XRUN", 1'474'560, 1'490'944);
    static_cast<void>(source_.read());
    now_ += 1ms;
    writeStatus("card0/pcm0p", "RUNNING", 0, 0);
  });

  EXPECT_EQ(lines[5], "HDA Intel PCH/Tx/ALC269VC Analog/state us = RUNNING:1:1000000 XRUN:1:1000");
}

TEST_F(AlsaSourceTest, RuntimePowerIsTakenFromTheKernelsOwnCount) {
  use("hdmi");

  const auto lines = change([this] {
    write("sys/class/sound/card2/device/power/runtime_active_time", "2710\n");
    write("sys/class/sound/card2/device/power/runtime_suspended_time", "900900\n");
    write("sys/class/sound/card2/device/power/runtime_status", "active\n");
  });

  EXPECT_EQ(lines.back(),
            "HDA ATI HDMI/StateTransitionTimes_ms/Runtime/power ms = active:1:500 suspended:0:500");
}

TEST_F(AlsaSourceTest, WhatVanishesIsSkippedAndTheRestStays) {
  use("analogue");
  static_cast<void>(source_.read());

  std::filesystem::remove(root_.path() / "proc/asound/card0/pcm0p/sub0/status");
  std::filesystem::remove(root_.path() / "sys/class/sound/card0/device/power/runtime_active_time");
  EXPECT_THAT(show(), SizeIs(3));

  std::filesystem::remove_all(root_.path() / "proc/asound/card0");
  EXPECT_THAT(show(), IsEmpty());
}

TEST_F(AlsaSourceTest, ACardThatIsPluggedInAgainIsAnother) {
  use("usb");

  const auto lines = change([this] {
    const auto card = root_.path() / "proc/asound/card1";
    std::filesystem::rename(card, root_.path() / "gone");
    static_cast<void>(source_.read());
    std::filesystem::rename(root_.path() / "gone", card);
    writeStatus("card1/pcm0p", "RUNNING", 480, 960);
  });

  EXPECT_THAT(lines, Each(Not(StartsWith("Scarlet Two/"))));
  EXPECT_THAT(show(), Contains("Scarlet Two/Tx/USB Audio/frames frames = 480"));
}

// A dangling link is listed in its directory but cannot be opened.
TEST_F(AlsaSourceTest, WhatVanishesAfterItsDirectoryWasListedIsSkipped) {
  use("analogue");
  const auto asound = root_.path() / "proc/asound";
  const auto before = show();

  for (const char* gone : {"card1", "card0/pcm9p", "card0/pcm0p/sub7"}) {
    std::filesystem::create_directory_symlink("nowhere", asound / gone);
  }

  EXPECT_EQ(show(), before);
}

TEST_F(AlsaSourceTest, TwoCardsOfOneNameAreDistinguished) {
  use("usb");
  addTwinOfUsbCard();

  const auto lines = show();

  EXPECT_THAT(lines, SizeIs(20));
  EXPECT_THAT(lines,
              ::testing::IsSupersetOf({"Scarlet Two/Tx/USB Audio/frames frames = 96000",
                                       "Scarlet Two 2/Tx/USB Audio/frames frames = 96000",
                                       "Scarlet Two 2/StateTransitionTimes_ms/Runtime/power ms = "
                                       "active:0:98000"}));
}

TEST_F(AlsaSourceTest, ACardGoesOnCountingUnderItsNameWhenItsTwinIsUnplugged) {
  use("usb");
  addTwinOfUsbCard();

  const auto lines = change([this] {
    std::filesystem::remove_all(root_.path() / "proc/asound/card1");
    writeStatus("card2/pcm0p", "RUNNING", 96'480, 97'504, 2001);
  });

  EXPECT_THAT(lines, ::testing::Contains("Scarlet Two 2/Tx/USB Audio/frames frames = 480"));
}

TEST_F(AlsaSourceTest, WithoutCardsThereIsNothing) { EXPECT_THAT(show(), IsEmpty()); }

TEST_F(AlsaSourceTest, ReadingsOfTheSameChannelsShareTheirList) {
  use("analogue");

  EXPECT_EQ(source_.read()->channels, source_.read()->channels);
}

TEST(AlsaTextTest, AStatusWithoutItsPointersIsNone) {
  EXPECT_FALSE(parsePcmStatus("state: RUNNING\nowner_pid   : 1\n").has_value());
  EXPECT_FALSE(parsePcmStatus("state: DANCING\nhw_ptr: 1\nappl_ptr: 1\n").has_value());
  EXPECT_FALSE(parsePcmStatus("state: RUNNING\nhw_ptr: -1\nappl_ptr: 1\n").has_value());
  EXPECT_FALSE(parsePcmStatus("").has_value());
  EXPECT_EQ(parsePcmStatus("closed\n")->state, 0U);
}

TEST(AlsaTextTest, CardsAreNamedByTheirShortNames) {
  const auto cards = parseCards(
      " 0 [PCH            ]: HDA-Intel - HDA Intel PCH\n"
      "                      HDA Intel PCH at 0xf7f10000 irq 32\n"
      "12 [Odd]: name    ]: USB-Audio - A - B\n");

  EXPECT_EQ(cards.at(0), "HDA Intel PCH");
  EXPECT_EQ(cards.size(), 2U);
  EXPECT_TRUE(parseCards("--- no soundcards ---\n").empty());
}

}  // namespace
}  // namespace halvox::platform::linux_
