#pragma once

#include <cstdint>

#include "platform/value.h"

namespace halvox::bench {

// Makes a message with ten fields, as audio frameworks send them. `number` makes it different from
// all others. Reserves room for the stamps that the service adds.
inline platform::Dictionary makeMessage(std::int64_t number) {
  platform::Dictionary message;
  message.reserve(14);
  message.set("frame_counter", number);
  message.set("sample_rate", 48000.0);
  message.set("channels", std::int32_t{2});
  message.set("io_buffer_frames", std::int32_t{512});
  message.set("is_running", true);
  message.set("volume", 0.75);
  message.set("route", "Speaker");
  message.set("format", "lpcm/float32");
  message.set("device_uid", "alsa_output.pci-0000_00_1f.3.analog-stereo");
  message.set("latency_ms", 10.67);
  return message;
}

}  // namespace halvox::bench
