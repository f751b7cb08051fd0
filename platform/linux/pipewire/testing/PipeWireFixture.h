#pragma once

#include <memory>

#include <gtest/gtest.h>

#include "platform/linux/pipewire/testing/PrivatePipeWire.h"

namespace halvox::pipewire_testing {

// A test with a private PipeWire. It is skipped where PipeWire's tools are not installed.
class PipeWireFixture : public ::testing::Test {
 protected:
  // Another SetUp() calls this one first, and returns if `audio` is null.
  void SetUp() override {
    if (const auto missing = PrivatePipeWire::missingTools(); !missing.empty()) {
      GTEST_SKIP() << missing;
    }
    auto made = std::make_unique<PrivatePipeWire>();
    ASSERT_TRUE(made->isReady());
    audio = std::move(made);
  }

  std::unique_ptr<PrivatePipeWire> audio;
};

}  // namespace halvox::pipewire_testing
