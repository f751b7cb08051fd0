#pragma once

#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "platform/linux/drivers/DriverSource.h"
#include "platform/linux/drivers/ReadingMaker.h"
#include "platform/linux/drivers/alsa/PcmCounters.h"

namespace halvox::platform::linux_ {

// What the kernel's sound cards tell below /proc/asound and /sys/class/sound.
//
//   group                     subgroup      channels
//   "Tx" playback,            the PCM       "frames", "application frames", "state"
//   "Rx" capture
//   "StateTransitionTimes_ms" "Runtime"     "power": active and suspended
//
// The driver is the card's name; of several cards of one name the later ones have their number
// behind it. Of a PCM with several substreams the others than the first have their number in the
// channel's name. Whatever is not there, or goes while it is read, is left out.
class AlsaSource final : public DriverSource {
 public:
  using Clock = PcmCounters::Clock;
  static constexpr std::size_t kMostChannels = 4000;

  // `now` is asked once a reading.
  explicit AlsaSource(std::filesystem::path root,
                      std::function<Clock::time_point()> now = Clock::now)
      : root_(std::move(root)), now_(std::move(now)) {}

  [[nodiscard]] std::string_view name() const override { return "alsa"; }
  [[nodiscard]] std::shared_ptr<const Reading> read() override;

 private:
  struct Card {
    std::string name;
    std::map<std::string, int> pcmNames{};  // how often each, with its direction
  };
  struct CardName {
    std::string own;    // as the kernel tells it
    std::string shown;  // as no other card is called
    std::uint64_t round = 0;
  };
  struct Substream {
    PcmCounters counters;
    std::uint64_t round = 0;
  };
  struct Power {
    bool isSuspended = false;
    std::uint64_t activations = 0;
    std::uint64_t suspensions = 0;
    std::uint64_t round = 0;
  };

  [[nodiscard]] std::string nameFor(const std::string& folder, const std::string& name,
                                    unsigned number);
  void readCard(int asound, const std::string& folder, Card card);
  void readPcm(int cardDirectory, const std::string& path, const std::string& folder, Card& card);
  void readSubstream(int pcmDirectory, const std::string& path, const std::string& folder,
                     const ChannelDescription& pcm);
  void readPower(const std::string& folder, const Card& card);

  const std::filesystem::path root_;
  const std::function<Clock::time_point()> now_;
  Clock::time_point time_{};
  std::uint64_t round_ = 0;
  std::map<std::string, CardName> cardNames_;    // by the card's folder
  std::map<std::string, Substream> substreams_;  // by path
  std::map<std::string, Power> powers_;          // by the card's folder
  ReadingMaker readings_;
};

}  // namespace halvox::platform::linux_
