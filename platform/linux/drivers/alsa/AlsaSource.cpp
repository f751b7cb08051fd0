#include "platform/linux/drivers/alsa/AlsaSource.h"

#include <algorithm>
#include <array>
#include <optional>
#include <utility>

#include <dirent.h>
#include <fcntl.h>

#include "platform/linux/base/WholeFile.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kLargestFile = 16'384;  // bytes
constexpr std::size_t kMostEntries = 256;     // cards, PCMs of a card, substreams of a PCM

using Directory = UniqueHandle<DIR*, ::closedir>;

// The number after the letters, for a name such as "card0"; none for any other name.
std::optional<unsigned> numberAfter(std::string_view name, std::string_view letters) {
  if (!name.starts_with(letters)) return std::nullopt;
  const auto number = parseSysfsNumber(name.substr(letters.size()));
  if (!number.has_value() || *number > 9999) return std::nullopt;
  return static_cast<unsigned>(*number);
}

std::vector<std::string> namesIn(int directory) {
  std::vector<std::string> names;
  // Use a copy of the descriptor, because closing the stream also closes its descriptor.
  UniqueFd own(::fcntl(directory, F_DUPFD_CLOEXEC, 0));
  const Directory stream(::fdopendir(own.get()));
  if (!stream) return names;
  static_cast<void>(own.release());  // the stream closes it
  while (const dirent* found = ::readdir(stream.get())) {
    if (found->d_name[0] != '.') names.emplace_back(found->d_name);
    if (names.size() == kMostEntries) break;
  }
  // A directory has no fixed order. The order matters, because later cards and devices of the same
  // name get a number.
  std::ranges::sort(names);
  return names;
}

std::optional<std::string> textOf(int directory, const std::string& name) {
  FileContent file =
      readWholeFile({.path = name.c_str(), .most = kLargestFile, .directory = directory});
  if (!file.isRead()) return std::nullopt;
  return std::move(file.bytes);
}

std::optional<std::uint64_t> numberIn(int directory, const char* name) {
  const auto text = textOf(directory, name);
  return text.has_value() ? parseSysfsNumber(*text) : std::nullopt;
}

std::vector<std::string> pcmStates() { return {kPcmStates.begin(), kPcmStates.end()}; }

}  // namespace

std::shared_ptr<const Reading> AlsaSource::read() {
  ++round_;
  // Read the clock once for all channels, so that their times can be compared.
  time_ = now_();
  const UniqueFd asound = openDirectory((root_ / "proc/asound").c_str());
  if (asound) {
    const auto names = parseCards(textOf(asound.get(), "cards").value_or(""));
    for (const std::string& folder : namesIn(asound.get())) {
      const auto number = numberAfter(folder, "card");
      if (!number.has_value()) continue;
      const auto name = names.find(*number);
      readCard(asound.get(), folder,
               {nameFor(folder, name == names.end() ? folder : name->second, *number)});
    }
  }
  // Entries that were not seen in this round have disappeared. A card that returns counts from
  // zero.
  const auto isGone = [this](const auto& item) { return item.second.round != round_; };
  std::erase_if(substreams_, isGone);
  std::erase_if(powers_, isGone);
  std::erase_if(cardNames_, isGone);
  return readings_.finish();
}

// If several cards have the same name, the later ones get their number. A card keeps its name when
// another one disappears, because it is still the same card and its counts continue.
std::string AlsaSource::nameFor(const std::string& folder, const std::string& name,
                                unsigned number) {
  const auto known = cardNames_.find(folder);
  if (known != cardNames_.end() && known->second.own == name) {
    known->second.round = round_;
    return known->second.shown;
  }
  const bool isTaken = std::ranges::any_of(cardNames_, [&](const auto& other) {
    return other.first != folder && other.second.shown == name;
  });
  std::string shown = isTaken ? name + " " + std::to_string(number) : name;
  cardNames_.insert_or_assign(folder, CardName{name, shown, round_});
  return shown;
}

void AlsaSource::readCard(int asound, const std::string& folder, Card card) {
  const UniqueFd directory = openDirectory(folder.c_str(), asound);
  if (!directory) return;
  for (const std::string& pcm : namesIn(directory.get())) {
    if (!pcm.starts_with("pcm")) continue;
    std::string path = folder;
    path.append("/").append(pcm);
    readPcm(directory.get(), path, pcm, card);
  }
  readPower(folder, card);
}

void AlsaSource::readPcm(int cardDirectory, const std::string& path, const std::string& folder,
                         Card& card) {
  // The kernel calls the folders pcm0p for playback and pcm0c for capture.
  const bool isPlayback = folder.ends_with('p');
  if (!isPlayback && !folder.ends_with('c')) return;
  const UniqueFd directory = openDirectory(folder.c_str(), cardDirectory);
  if (!directory) return;
  std::string name = parsePcmName(textOf(directory.get(), "info").value_or("")).value_or(folder);
  // If several devices have the same name, the later ones get a number.
  const int others = card.pcmNames[(isPlayback ? "p" : "c") + name]++;
  if (others > 0) name += " " + std::to_string(others + 1);

  ChannelDescription pcm;
  pcm.driverName = card.name;
  pcm.group = isPlayback ? "Tx" : "Rx";
  pcm.subGroup = std::move(name);
  for (const std::string& substream : namesIn(directory.get())) {
    std::string place = path;
    place.append("/").append(substream);
    readSubstream(directory.get(), place, substream, pcm);
  }
}

void AlsaSource::readSubstream(int pcmDirectory, const std::string& path, const std::string& folder,
                               const ChannelDescription& pcm) {
  const auto number = numberAfter(folder, "sub");
  if (!number.has_value() || substreams_.size() >= kMostChannels) return;
  const auto text = textOf(pcmDirectory, folder + "/status");
  const auto status = text.has_value() ? parsePcmStatus(*text) : std::nullopt;
  if (!status.has_value()) return;
  Substream& substream = substreams_[path];
  substream.round = round_;
  PcmCounters& counters = substream.counters;
  counters.look(*status, time_);

  const std::string suffix = *number == 0 ? "" : " " + std::to_string(*number);
  const auto add = [&](const char* name, IOReportFormat format, const char* unit,
                       std::span<const std::uint64_t> values) {
    ChannelDescription channel = pcm;
    channel.format = format;
    channel.kind = IOReportKind::kCounter;
    channel.channelName = name + suffix;
    channel.unitLabel = unit;
    if (format == IOReportFormat::kState) channel.states = pcmStates();
    readings_.add(path + '/' + name, std::move(channel), values);
  };
  add("frames", IOReportFormat::kSimple, "frames", std::array{counters.hardwareFrames()});
  add("application frames", IOReportFormat::kSimple, "frames",
      std::array{counters.applicationFrames()});
  std::vector<std::uint64_t> states;
  for (const auto& [transitions, residency] : counters.states()) {
    states.push_back(transitions);
    states.push_back(static_cast<std::uint64_t>(residency.count()));
  }
  add("state", IOReportFormat::kState, "us", states);
}

void AlsaSource::readPower(const std::string& folder, const Card& card) {
  const UniqueFd directory =
      openDirectory((root_ / "sys/class/sound" / folder / "device/power").c_str());
  if (!directory) return;
  const auto active = numberIn(directory.get(), "runtime_active_time");
  const auto suspended = numberIn(directory.get(), "runtime_suspended_time");
  // Devices without runtime power management have no such files.
  if (!active.has_value() || !suspended.has_value()) return;
  const bool isSuspended =
      cleanText(textOf(directory.get(), "runtime_status").value_or("")) == "suspended";

  // The kernel counts the times but not the transitions, which are therefore derived from two
  // readings.
  const bool isNew = !powers_.contains(folder);
  Power& power = powers_[folder];
  power.round = round_;
  if (!isNew && power.isSuspended != isSuspended) {
    ++(isSuspended ? power.suspensions : power.activations);
  }
  power.isSuspended = isSuspended;
  ChannelDescription channel;
  channel.format = IOReportFormat::kState;
  channel.driverName = card.name;
  channel.group = "StateTransitionTimes_ms";
  channel.subGroup = "Runtime";
  channel.channelName = "power";
  channel.unitLabel = "ms";
  channel.states = {"active", "suspended"};
  readings_.add(folder + "/power", std::move(channel),
                std::array{power.activations, *active, power.suspensions, *suspended});
}

}  // namespace halvox::platform::linux_
