#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

#include "session/Guarded.h"

namespace halvox {

// Limits the lines about failures to send to one a second, for all sessions of a service together.
// While a server was away, one line for each message made 142,576 lines in a minute. The counters
// have the number of all failures.
//
// Any thread may call. Shared by the holders of the counters.
class FailureLog {
 public:
  // Notes a failure. Returns std::nullopt if it must not be logged. Otherwise returns the end of
  // its line: how many failures had no line since the previous line, or nothing if none.
  [[nodiscard]] std::optional<std::string> note();

 private:
  struct State {
    std::uint64_t unlogged = 0;
    std::optional<std::chrono::milliseconds> last{};  // uptime of the process
  };

  Guarded<State> state_;
};

}  // namespace halvox
