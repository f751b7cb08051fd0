#pragma once

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "client/HalvoxClient.h"
#include "client/testing/TestService.h"

namespace halvox::client {

// The time limit of the tests. It is long enough for a slow machine.
inline constexpr std::chrono::seconds kPatience{20};

// A fixture with a test service in a scratch directory.
class HalvoxClientFixture : public testing::Test {
 protected:
  static constexpr Category kPlayback = 4;
  static constexpr EventType kStart = 1;

  HalvoxClientFixture() : socketPath_(scratch_.path("reporting.sock")), service_(socketPath_) {}

  [[nodiscard]] Options options() const {
    return {.socketPath = socketPath_,
            .reconnectMin = std::chrono::milliseconds(5),
            .reconnectMax = std::chrono::milliseconds(100)};
  }
  // Returns the numbers under the key "n" in all messages that arrived, in their order.
  std::vector<std::int64_t> numbersReceived() {
    std::vector<std::int64_t> numbers;
    for (const auto& call : service_.calls()) {
      if (call.member != "sendMessage") continue;
      numbers.push_back(call.arguments.at(0).dictionary().find("n")->toInt64());
    }
    return numbers;
  }

  ScratchDirectory scratch_;
  std::string socketPath_;
  TestService service_;
};

inline void expectBalance(const Counters& counters) {
  EXPECT_EQ(counters.accepted,
            counters.acknowledged + counters.refused + counters.lost + counters.pending);
}

}  // namespace halvox::client
