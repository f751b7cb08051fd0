#pragma once

#include <cstdint>
#include <utility>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "reporters/pipewire/RecordingReportingClient.h"
#include "reporters/pipewire/StreamTracker.h"

namespace halvox::pipewire_reporter {

inline constexpr GlobalID kSpeakers = 10;
inline constexpr GlobalID kHeadphones = 11;
inline constexpr GlobalID kStream = 20;
inline constexpr std::uint32_t kCookie = 0xABCD1234;
inline constexpr std::uint64_t kSerial = 55;

// A fixture with a tracker that knows two devices, and a client that records its operations.
class StreamTrackerFixture : public testing::Test {
 protected:
  StreamTrackerFixture() {
    tracker.serverConnected(kCookie);
    addDevice(kSpeakers, "speakers", "Speakers");
    addDevice(kHeadphones, "headphones", "Headphones");
  }

  void addDevice(GlobalID id, const char* name, const char* description) {
    tracker.nodeAdded({.id = id,
                       .serial = id,
                       .mediaClass = "Audio/Sink",
                       .properties = {{"node.name", name}, {"node.description", description}}});
  }
  void addStream(const char* mediaClass = "Stream/Output/Audio", Properties properties = {}) {
    properties.emplace("application.process.binary", "player");
    tracker.nodeAdded({.id = kStream,
                       .serial = kSerial,
                       .mediaClass = mediaClass,
                       .properties = std::move(properties)});
  }
  // Adds a stream that runs at half volume, and forgets the operations that this caused.
  void runStream() {
    addStream();
    setVolume(0.5F);
    tracker.streamRunningChanged(kStream, true);
    client.forget();
  }
  void setVolume(float volume) {
    tracker.streamVolumeChanged(kStream, {.volume = volume, .channels = {{1, 1}}, .muted = false});
  }
  [[nodiscard]] double sentVolume() const {
    return client.last("volume").find(kVolumeKey)->toDouble();
  }
  [[nodiscard]] bool sentPlaying() const {
    return client.last("volume").find(kPlayingKey)->toBool();
  }

  RecordingReportingClient client;
  StreamTracker tracker{client};
};

}  // namespace halvox::pipewire_reporter
