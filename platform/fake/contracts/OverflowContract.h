#pragma once

#include <algorithm>
#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/overflow.h"

namespace halvox::platform::contract {

// What every OverflowService promises. `Harness` has
//   OverflowService& service();
template <typename Harness>
class OverflowContract : public ::testing::Test {
 protected:
  OverflowService& service() { return harness_.service(); }

  OverflowPlace write(std::string_view text) {
    OverflowPlace place;
    const auto error = service().write(std::as_bytes(std::span(text)), place);
    EXPECT_EQ(error, std::nullopt);
    EXPECT_EQ(place.length, text.size());
    return place;
  }
  std::string read(OverflowPlace place) {
    std::string text(place.length, '\0');
    EXPECT_EQ(service().read(place, std::as_writable_bytes(std::span(text))), std::nullopt);
    return text;
  }

  Harness harness_;
};

TYPED_TEST_SUITE_P(OverflowContract);

TYPED_TEST_P(OverflowContract, BytesAreReadAsTheyWereWritten) {
  const std::string zeros("a\0\0b", 4);
  const OverflowPlace one = this->write(zeros);
  const OverflowPlace other = this->write("something else");

  EXPECT_EQ(this->read(other), "something else");
  EXPECT_EQ(this->read(one), zeros);
  EXPECT_EQ(this->read(one), zeros);
}

TYPED_TEST_P(OverflowContract, PiecesOfManyBlocksKeepApart) {
  std::vector<OverflowPlace> places;
  for (char letter = 'a'; letter <= 'e'; ++letter) {
    places.push_back(this->write(std::string(100'001, letter)));
  }

  char letter = 'a';
  for (const OverflowPlace& place : places) {
    EXPECT_EQ(this->read(place), std::string(100'001, letter++));
  }
}

TYPED_TEST_P(OverflowContract, ReleaseLeavesOtherPiecesAsTheyAre) {
  const OverflowPlace before = this->write(std::string(5000, 'x'));
  const OverflowPlace released = this->write(std::string(5000, 'y'));
  const OverflowPlace after = this->write(std::string(5000, 'z'));

  this->service().release(released);

  EXPECT_EQ(this->read(before), std::string(5000, 'x'));
  EXPECT_EQ(this->read(after), std::string(5000, 'z'));
}

TYPED_TEST_P(OverflowContract, TakesBytesAgainAfterAllWereReleased) {
  this->service().release(this->write("first"));

  const OverflowPlace place = this->write("second");

  EXPECT_EQ(this->read(place), "second");
}

TYPED_TEST_P(OverflowContract, ThreadsWriteAndReadSideBySide) {
  std::vector<std::thread> threads;
  for (char letter = 'a'; letter <= 'd'; ++letter) {
    threads.emplace_back([this, letter] {
      const std::string text(20'000, letter);
      for (int round = 0; round < 20; ++round) {
        const OverflowPlace place = this->write(text);
        EXPECT_EQ(this->read(place), text);
        this->service().release(place);
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

TYPED_TEST_P(OverflowContract, AClientMayHoldSomethingInMemory) {
  EXPECT_GT(this->service().memoryPerClient(), 0U);
}

REGISTER_TYPED_TEST_SUITE_P(OverflowContract, BytesAreReadAsTheyWereWritten,
                            PiecesOfManyBlocksKeepApart, ReleaseLeavesOtherPiecesAsTheyAre,
                            TakesBytesAgainAfterAllWereReleased, ThreadsWriteAndReadSideBySide,
                            AClientMayHoldSomethingInMemory);

}  // namespace halvox::platform::contract
