#include "platform/fake/FakeConnectionService.h"

#include <array>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace halvox::platform {
namespace {

// Keeps what a request contained, and the reply if it is not answered at once.
struct Recorder final : ExportedObject {
  std::vector<Value> arguments;
  ProcessID sender = 0;
  RequestToken request;
  ReplyCallback reply;
};

void answer(ExportedObject& object, Invocation&& invocation) {
  auto& recorder = static_cast<Recorder&>(object);
  recorder.arguments.assign(invocation.arguments.begin(), invocation.arguments.end());
  recorder.sender = invocation.context.sender;
  invocation.reply(std::nullopt, true);
}

void keep(ExportedObject& object, Invocation&& invocation) {
  auto& recorder = static_cast<Recorder&>(object);
  recorder.request = std::move(invocation.context.token);
  recorder.reply = std::move(invocation.reply);
}

constexpr std::array<InterfaceMethod, 2> kMethods = {{
    {.name = "answer", .in = "a{sv}uqaax", .out = "b", .invoke = &answer},
    {.name = "keep", .in = "x", .out = "b", .invoke = &keep},
}};
constexpr NSXPCInterface kInterface{.name = "test", .objectPath = "/test", .methods = kMethods};

class FakeConnectionServiceTest : public testing::Test, public NSXPCListenerDelegate {
 protected:
  FakeConnectionServiceTest() { connections_.serviceListener().setDelegate(*this); }

  bool listenerShouldAcceptNewConnection(
      const std::shared_ptr<NSXPCConnection>& connection) override {
    connection->setExportedInterface(kInterface);
    connection->setExportedObject(recorder_);
    connection->setInterruptionHandler([this] { steps_.emplace_back("interrupted"); });
    connection->setInvalidationHandler([this] { steps_.emplace_back("invalidated"); });
    connection->resume();
    return accept_;
  }

  Journal journal_;
  FakeConnectionService connections_{journal_};
  std::shared_ptr<Recorder> recorder_ = std::make_shared<Recorder>();
  std::vector<std::string> steps_;
  bool accept_ = true;
};

TEST_F(FakeConnectionServiceTest, ConnectingShowsTheConnectionToTheDelegate) {
  const auto connection = connections_.connect(12);

  EXPECT_TRUE(connection->isAccepted());
  EXPECT_TRUE(connection->isResumed());
  EXPECT_EQ(connection->processIdentifier(), 12);
  EXPECT_EQ(connection->exportedInterface(), &kInterface);
}

TEST_F(FakeConnectionServiceTest, ARefusalIsSeen) {
  accept_ = false;
  EXPECT_FALSE(connections_.connect(12)->isAccepted());
}

TEST_F(FakeConnectionServiceTest, ConnectingWithoutADelegateIsAnError) {
  FakeConnectionService none(journal_);
  EXPECT_THROW(none.connect(12), std::logic_error);
}

TEST_F(FakeConnectionServiceTest, ARequestReachesTheObjectAndItsReplyTheTest) {
  const auto connection = connections_.connect(12);

  const auto call =
      connection->call("answer", {Dictionary{{"a", 1}}, 4U, std::uint16_t{1}, Array{}});

  EXPECT_EQ(recorder_->arguments.size(), 4U);
  EXPECT_EQ(recorder_->arguments[0], Value(Dictionary{{"a", 1}}));
  EXPECT_EQ(recorder_->sender, 12);
  EXPECT_EQ(call->value(), Value(true));
  EXPECT_EQ(journal_.texts(JournalKind::kReply), std::vector<std::string>{"answer"});
}

TEST_F(FakeConnectionServiceTest, ALateReplyIsAddedToItsCall) {
  const auto connection = connections_.connect(12);
  const auto call = connection->call("keep", {7});
  EXPECT_FALSE(call->isAnswered());
  EXPECT_THROW(static_cast<void>(call->value()), std::logic_error);

  recorder_->reply(Error{.domain = "d", .code = 1, .description = ""}, Value());
  recorder_->reply(std::nullopt, 5);

  ASSERT_EQ(call->replies().size(), 2U);
  EXPECT_EQ(call->replies()[0].error->domain, "d");
  EXPECT_EQ(call->replies()[1].value, Value(5));
}

TEST_F(FakeConnectionServiceTest, ARequestIsOpenWhileItsTokenIsHeld) {
  const auto connection = connections_.connect(12);
  static_cast<void>(connection->call("keep", {7}));
  EXPECT_EQ(connection->openRequests(), 1U);

  recorder_->request.reset();

  EXPECT_EQ(connection->openRequests(), 0U);
}

TEST_F(FakeConnectionServiceTest, WrongRequestsAreErrorsOfTheTest) {
  const auto connection = connections_.connect(12);
  EXPECT_THROW(connection->call("missing"), std::invalid_argument);
  EXPECT_THROW(connection->call("keep"), std::invalid_argument);
  EXPECT_THROW(connection->call("answer", {1}), std::invalid_argument);
  connection->invalidate();
  EXPECT_THROW(connection->call("keep", {7}), std::logic_error);
}

TEST_F(FakeConnectionServiceTest, HandlersAreCalledUntilTheConnectionHasEnded) {
  const auto connection = connections_.connect(12);

  connection->interrupt();
  connection->invalidate();
  connection->invalidate();
  connection->interrupt();

  EXPECT_EQ(steps_, (std::vector<std::string>{"interrupted", "invalidated"}));
}

TEST_F(FakeConnectionServiceTest, AnInvalidatedConnectionLetsGoOfItsObject) {
  const auto connection = connections_.connect(12);
  EXPECT_EQ(recorder_.use_count(), 2);

  connection->invalidate();

  EXPECT_EQ(recorder_.use_count(), 1);
}

TEST_F(FakeConnectionServiceTest, ClearingLetsGoOfAllObjectsWithoutCallingHandlers) {
  const auto connection = connections_.connect(12);

  connections_.clear();

  EXPECT_EQ(recorder_.use_count(), 1);
  EXPECT_TRUE(steps_.empty());
}

TEST_F(FakeConnectionServiceTest, TheListenerReturnsAtOnceAndSaysThatItWasResumed) {
  EXPECT_FALSE(connections_.serviceListener().isResumed());
  connections_.serviceListener().resume();
  EXPECT_TRUE(connections_.serviceListener().isResumed());
}

}  // namespace
}  // namespace halvox::platform
