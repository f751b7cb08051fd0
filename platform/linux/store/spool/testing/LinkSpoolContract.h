#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/linux/store/spool/LinkSpool.h"

namespace halvox::platform::linux_ {

// What every LinkSpool must do. A harness has spool(), settle(), which waits until all messages are
// stored, close(), which closes the store, and stored(), which counts the calls of onStored().
template <typename Harness>
class LinkSpoolContract : public testing::Test {
 protected:
  static SpooledMessage message(int number) {
    return {.subject = "halvox.media", .identifier = std::to_string(number), .body = "{}"};
  }
  void append(int first, int count) {
    for (int number = first; number < first + count; ++number) {
      ASSERT_NE(spool().append(message(number)), 0U);
    }
    ASSERT_TRUE(harness_.settle());
  }
  // The identifiers of all stored messages after a number.
  std::vector<std::string> readAfter(LinkSpool::Number after) {
    std::vector<std::string> identifiers;
    while (true) {
      auto read = spool().readAfter(after);
      EXPECT_TRUE(read) << read.error().message;
      if (!read || read->through == after) return identifiers;
      for (const auto& [number, message] : read->messages) {
        EXPECT_GT(number, after);
        identifiers.push_back(message.identifier);
      }
      after = read->through;
    }
  }
  LinkSpool& spool() { return harness_.spool(); }

  Harness harness_;
};
TYPED_TEST_SUITE_P(LinkSpoolContract);

TYPED_TEST_P(LinkSpoolContract, BeginsEmpty) {
  EXPECT_EQ(this->spool().lastAppended(), 0U);
  EXPECT_FALSE(this->spool().hasUnstored());
  EXPECT_TRUE(this->spool().canKeep());
  EXPECT_TRUE(this->readAfter(0).empty());
}

TYPED_TEST_P(LinkSpoolContract, GivesNumbersThatGrow) {
  const auto first = this->spool().append(this->message(1));
  const auto second = this->spool().append(this->message(2));

  EXPECT_GT(first, 0U);
  EXPECT_GT(second, first);
  EXPECT_EQ(this->spool().lastAppended(), second);
}

TYPED_TEST_P(LinkSpoolContract, ReadsEverythingInOrder) {
  this->append(1, 9);

  EXPECT_EQ(this->readAfter(0),
            (std::vector<std::string>{"1", "2", "3", "4", "5", "6", "7", "8", "9"}));
}

TYPED_TEST_P(LinkSpoolContract, ReadsTheWholeMessage) {
  const SpooledMessage message{
      .subject = "halvox.a.1", .identifier = "run-1", .body = std::string("\0{}", 3)};
  ASSERT_NE(this->spool().append(message), 0U);
  ASSERT_TRUE(this->harness_.settle());

  const auto read = this->spool().readAfter(0);

  ASSERT_TRUE(read);
  ASSERT_EQ(read->messages.size(), 1U);
  EXPECT_EQ(read->messages.front().second, message);
}

TYPED_TEST_P(LinkSpoolContract, ReadsOnAfterANumber) {
  this->append(1, 3);
  const LinkSpool::Number last = this->spool().lastAppended();
  this->append(4, 2);

  EXPECT_EQ(this->readAfter(last), (std::vector<std::string>{"4", "5"}));
  EXPECT_EQ(this->readAfter(last - 1), (std::vector<std::string>{"3", "4", "5"}));
}

TYPED_TEST_P(LinkSpoolContract, ForgetsWhatIsRemoved) {
  this->append(1, 5);
  const LinkSpool::Number last = this->spool().lastAppended();

  this->spool().removeThrough(last - 2);
  this->append(6, 1);

  EXPECT_EQ(this->readAfter(0), (std::vector<std::string>{"4", "5", "6"}));
}

TYPED_TEST_P(LinkSpoolContract, SaysWhenMessagesWereStored) {
  this->append(1, 1);

  EXPECT_FALSE(this->spool().hasUnstored());
  EXPECT_GE(this->harness_.stored(), 1);
}

TYPED_TEST_P(LinkSpoolContract, TakesNothingAfterTheEnd) {
  this->harness_.close();

  EXPECT_EQ(this->spool().append(this->message(1)), 0U);
}

REGISTER_TYPED_TEST_SUITE_P(LinkSpoolContract, BeginsEmpty, GivesNumbersThatGrow,
                            ReadsEverythingInOrder, ReadsTheWholeMessage, ReadsOnAfterANumber,
                            ForgetsWhatIsRemoved, SaysWhenMessagesWereStored,
                            TakesNothingAfterTheEnd);

}  // namespace halvox::platform::linux_
