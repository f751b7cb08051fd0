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

// Reads what the kernel reports about sound cards, below /proc/asound and /sys/class/sound.
//
//   group                     subgroup      channels
//   "Tx" playback,            the PCM       "frames", "application frames", "state"
//   "Rx" capture
//   "StateTransitionTimes_ms" "Runtime"     "power": active and suspended
//
// The driver is the card's name. If several cards have the same name, the later ones are reported
// as "name <card number>". If a PCM has several substreams, all but the first have their number in
// the channel's name. What is missing, or disappears while it is read, is skipped without a log
// line, because cards come and go.
//
// Its SourceReader owns it and calls it on one thread.
class AlsaSource final : public DriverSource {
 public:
  using Clock = PcmCounters::Clock;
  static constexpr std::size_t kMostChannels =
      4000;  // of all cards; far more than real machines have

  // `now` is called once for each reading, so that all its channels have the same time.
  explicit AlsaSource(std::filesystem::path root,
                      std::function<Clock::time_point()> now = Clock::now)
      : root_(std::move(root)), now_(std::move(now)) {}

  [[nodiscard]] std::string_view name() const override { return "alsa"; }
  [[nodiscard]] std::shared_ptr<const Reading> read() override;

 private:
  struct Card {
    std::string name;
    std::map<std::string, int> pcmNames{};  // how often each name was found in each direction
  };
  struct CardName {
    std::string own;    // from the kernel
    std::string shown;  // unique among the cards
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
