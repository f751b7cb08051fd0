#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <optional>

#include "platform/linux/drivers/alsa/AlsaText.h"

namespace halvox::platform::linux_ {

// Counts one PCM substream across its streams: the kernel's pointers restart with each stream, and
// the counts here continue.
//
// The kernel keeps no history. A state counts from the reading that finds it to the first reading
// that finds another one. States that begin and end between two readings are not counted. Belongs
// to the source's thread.
class PcmCounters {
 public:
  using Clock = std::chrono::steady_clock;

  struct State {
    std::uint64_t transitions = 0;
    std::chrono::microseconds residency{};
  };

  // Adds the status at a time. Times must not go back.
  void look(const PcmStatus& status, Clock::time_point now);

  [[nodiscard]] std::uint64_t hardwareFrames() const { return hardware_.total; }
  [[nodiscard]] std::uint64_t applicationFrames() const { return application_.total; }
  [[nodiscard]] const std::array<State, kPcmStates.size()>& states() const { return states_; }

 private:
  struct Pointer {
    std::uint64_t last = 0;
    std::uint64_t total = 0;
  };
  static void count(Pointer& pointer, std::uint64_t now, bool isNewStream);

  std::optional<PcmStatus> last_;
  Clock::time_point lastTime_{};
  Pointer hardware_;
  Pointer application_;
  std::array<State, kPcmStates.size()> states_{};
};

}  // namespace halvox::platform::linux_
