#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "session/LinkFixture.h"

// Which client is charged for messages that wait for the link.
namespace halvox::link_test {
namespace {

using namespace std::chrono_literals;

class SessionLinkChargesTest : public LinkFixture {
 protected:
  SessionLinkChargesTest() { session_->chargeTo(owner_); }

  void sendFromAnother() {
    session_->sendMessage(Dictionary{{"a", std::string(1000, 'x')}}, kPlayback, kStart, nullptr,
                          sender_);
  }

  const std::shared_ptr<ResourceAccount> owner_ = std::make_shared<ResourceAccount>();
  const std::shared_ptr<ResourceAccount> sender_ = std::make_shared<ResourceAccount>();
};

TEST_F(SessionLinkChargesTest, ASingleMessageOfAnotherClientIsChargedToThatOne) {
  sendFromAnother();
  EXPECT_GE(sender_->use().bytes, 1000U) << "in the queue of the link";
  run();
  EXPECT_GE(sender_->use().bytes, 1000U) << "for its second";
  EXPECT_EQ(owner_->use().bytes, 0U);
  platform_.dispatch.advance(1s);

  EXPECT_EQ(sender_->use().bytes, 0U);
  EXPECT_EQ(framework_.singleMessages().size(), 1U);
}

TEST_F(SessionLinkChargesTest, AMessageWhoseKeysWereCleanedIsChargedTwice) {
  const auto chargeOf = [this](const std::string& key) {
    // As the decoder makes it: the texts are in the message's own block, with room for the tag.
    const std::string text(100, 'x');
    std::vector<Dictionary::Entry> entries;
    for (int number = 0; number < 8; ++number) {
      entries.push_back({key + std::to_string(number), platform::Value::lending(text)});
    }
    session_->sendMessage(Dictionary(entries, 1), kPlayback, kStart, nullptr, sender_);
    const std::size_t charged = sender_->use().bytes;
    run();
    platform_.dispatch.advance(1s);
    EXPECT_EQ(sender_->use().bytes, 0U);
    return charged;
  };

  const std::size_t withoutBlanks = chargeOf("key_");
  const std::size_t withBlanks = chargeOf("key ");

  EXPECT_GE(withoutBlanks, 800U);
  EXPECT_GE(withBlanks, withoutBlanks + 800U);
}

TEST_F(SessionLinkChargesTest, OwnersAreChargedForTheHistoryAndSendersForWhatWaits) {
  holdDiscoveries();
  start();

  sendFromAnother();
  const std::size_t history = (*session_->nestedAggregatedPayloadData())->memorySize();
  EXPECT_GE(sender_->use().bytes, 1000U);
  EXPECT_EQ(owner_->use().bytes, history);
  framework_.answerDiscovery(kServers);
  run();

  EXPECT_EQ(sender_->use().bytes, 0U);
  EXPECT_EQ(owner_->use().bytes, history);
}

TEST_F(SessionLinkChargesTest, MessagesOfTheSessionItselfAreChargedToItsOwner) {
  holdDiscoveries();
  start();
  send({{"a", 1}});

  session_->stop();  // the summary and the stop job wait now; the history has been freed
  EXPECT_GT(owner_->use().bytes, 0U);
  framework_.answerDiscovery(kServers);
  run();

  EXPECT_EQ(owner_->use().bytes, 0U);
}

}  // namespace
}  // namespace halvox::link_test
