#pragma once

#include <array>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/connection.h"

namespace halvox::platform::contract {

// The user of a client, as seen by the service.
enum class ContractUser : std::uint8_t { kOwner, kStranger };

// The answer to a client: a text, or the name of an error.
struct ContractAnswer {
  std::string text;
  std::string errorName;
};

// One request as the object received it.
struct SeenRequest {
  std::string text;
  ProcessID sender = 0;
  RequestToken token;
};

// The object that the suite exports. Any thread may call.
class ContractObject final : public ExportedObject {
 public:
  void see(const Invocation& request) {
    const std::lock_guard held(mutex_);
    seen_.push_back({.text = std::string(request.arguments[0].string()),
                     .sender = request.context.sender,
                     .token = request.context.token});
  }
  void keep(ReplyCallback reply) {
    const std::lock_guard held(mutex_);
    kept_ = std::move(reply);
  }
  // Answers the request that was kept, from a thread of its own.
  void answerKept(const std::string& text) {
    ReplyCallback reply;
    {
      const std::lock_guard held(mutex_);
      reply = std::move(kept_);
    }
    std::thread([&] { reply(std::nullopt, text); }).join();
  }
  [[nodiscard]] std::vector<SeenRequest> seen() const {
    const std::lock_guard held(mutex_);
    return seen_;
  }
  [[nodiscard]] bool keepsOne() const {
    const std::lock_guard held(mutex_);
    return static_cast<bool>(kept_);
  }

 private:
  mutable std::mutex mutex_;
  std::vector<SeenRequest> seen_;
  ReplyCallback kept_;
};

// The object's methods. Each takes one text. "echo" returns it, "keep" answers later, "fail"
// returns an error, and "end", which only the owner may call, returns the text.
inline const NSXPCInterface& contractInterface() {
  constexpr auto kEcho = +[](ExportedObject& object, Invocation&& request) {
    static_cast<ContractObject&>(object).see(request);
    request.reply(std::nullopt, request.arguments[0]);
  };
  constexpr auto kKeep = +[](ExportedObject& object, Invocation&& request) {
    static_cast<ContractObject&>(object).see(request);
    static_cast<ContractObject&>(object).keep(std::move(request.reply));
  };
  constexpr auto kFail = +[](ExportedObject& /*object*/, Invocation&& request) {
    request.reply(Error{.description = "no", .name = "com.tarno.test.Error"}, Value());
  };
  constexpr MethodEffect kNoMore = MethodEffect::kHoldsNoMore;
  static constexpr std::array kMethods{
      InterfaceMethod{"echo", "s", "s", kNoMore, kEcho},
      InterfaceMethod{"keep", "s", "s", kNoMore, kKeep},
      InterfaceMethod{"fail", "s", "s", kNoMore, kFail},
      InterfaceMethod{"end", "s", "s", kNoMore, kEcho, nullptr, MethodAccess::kOwner},
  };
  static constexpr NSXPCInterface kInterface{.name = "com.tarno.test.Contract",
                                             .objectPath = "/com/tarno/test/contract",
                                             .methods = kMethods};
  return kInterface;
}

// Exports a new object for each client, and records the events of connections.
class ContractDelegate final : public NSXPCListenerDelegate {
 public:
  bool listenerShouldAcceptNewConnection(
      const std::shared_ptr<NSXPCConnection>& connection) override {
    auto object = std::make_shared<ContractObject>();
    connection->setExportedInterface(contractInterface());
    connection->setExportedObject(object);
    connection->setInterruptionHandler([this] { note("interrupted"); });
    connection->setInvalidationHandler([this] { note("invalidated"); });
    const std::lock_guard held(mutex_);
    events_.emplace_back("asked");
    object_ = object;
    process_ = connection->processIdentifier();
    if (refuses_) return false;
    connection->resume();
    return true;
  }

  void refuse() {
    const std::lock_guard held(mutex_);
    refuses_ = true;
  }
  [[nodiscard]] std::vector<std::string> events() const {
    const std::lock_guard held(mutex_);
    return events_;
  }
  // The object of the latest client; null if nobody else holds it.
  [[nodiscard]] std::shared_ptr<ContractObject> object() const {
    const std::lock_guard held(mutex_);
    return object_.lock();
  }
  [[nodiscard]] ProcessID process() const {
    const std::lock_guard held(mutex_);
    return process_;
  }

 private:
  void note(const char* event) {
    const std::lock_guard held(mutex_);
    events_.emplace_back(event);
  }

  mutable std::mutex mutex_;
  bool refuses_ = false;
  std::vector<std::string> events_;
  std::weak_ptr<ContractObject> object_;
  ProcessID process_ = 0;
};

// What every ConnectionService promises.
//
// `Harness` is default-constructible and has
//   void serve(NSXPCListenerDelegate& delegate);  called once, before the first client
//   void end();  ends serving; nothing calls the delegate's objects afterwards
//   bool canBe(ContractUser user);  whether the test can act as that user
//   Client connect(ContractUser user);
//   bool letHappen(const std::function<bool()>& condition);  false if it never becomes true
// and `Client` is movable and has
//   ProcessID process();
//   void post(const std::string& method, const std::string& text);  sends a request
//   std::optional<ContractAnswer> answer();  to the oldest request; none if there is no answer
//   void leave();  disconnects
template <typename Harness>
class ConnectionContract : public ::testing::Test {
 protected:
  ConnectionContract() { harness_.serve(delegate_); }
  ~ConnectionContract() override { harness_.end(); }

  auto connect() { return harness_.connect(ContractUser::kOwner); }
  template <typename Client>
  static ContractAnswer call(Client& client, const std::string& method, const std::string& text) {
    client.post(method, text);
    return client.answer().value_or(ContractAnswer{.text = "none came", .errorName = {}});
  }
  // Waits until the object keeps the answer to a request "keep".
  bool letKeepOne() {
    return harness_.letHappen([this] {
      const auto object = delegate_.object();
      return object != nullptr && object->keepsOne();
    });
  }

  Harness harness_;
  ContractDelegate delegate_;
};
TYPED_TEST_SUITE_P(ConnectionContract);

TYPED_TEST_P(ConnectionContract, DelegateIsAskedOnceForEachClientWhoseProcessIsKnown) {
  auto first = this->connect();
  this->call(first, "echo", "a");
  EXPECT_EQ(this->delegate_.process(), first.process());
  auto second = this->connect();
  this->call(second, "echo", "a");

  EXPECT_THAT(this->delegate_.events(), ::testing::ElementsAre("asked", "asked"));
}

TYPED_TEST_P(ConnectionContract, RequestReachesTheObjectAndItsAnswerTheClient) {
  auto client = this->connect();

  const ContractAnswer answer = this->call(client, "echo", "hello");

  EXPECT_EQ(answer.text, "hello");
  EXPECT_EQ(answer.errorName, "");
}

TYPED_TEST_P(ConnectionContract, ErrorReachesTheClientUnderItsName) {
  auto client = this->connect();

  EXPECT_EQ(this->call(client, "fail", "a").errorName, "com.tarno.test.Error");
}

TYPED_TEST_P(ConnectionContract, RequestsOfAClientComeInTheirOrder) {
  auto client = this->connect();

  for (int number = 0; number < 100; ++number) client.post("echo", std::to_string(number));

  for (int number = 0; number < 100; ++number) {
    const auto answer = client.answer();
    ASSERT_TRUE(answer.has_value());
    ASSERT_EQ(answer->text, std::to_string(number));
  }
  const std::vector<SeenRequest> seen = this->delegate_.object()->seen();
  for (std::size_t number = 0; number < 100; ++number) {
    ASSERT_EQ(seen[number].text, std::to_string(number));
  }
}

TYPED_TEST_P(ConnectionContract, RequestNamesItsSenderAndHasATokenOfItsOwn) {
  auto client = this->connect();
  this->call(client, "echo", "a");
  this->call(client, "echo", "b");

  const std::vector<SeenRequest> seen = this->delegate_.object()->seen();

  ASSERT_EQ(seen.size(), 2U);
  for (const SeenRequest& request : seen) {
    EXPECT_EQ(request.sender, client.process());
    EXPECT_NE(request.token, nullptr);
  }
  EXPECT_NE(seen[0].token, seen[1].token) << "each request has a token of its own";
}

TYPED_TEST_P(ConnectionContract, LateAnswerOfAnotherThreadReachesTheClient) {
  auto client = this->connect();
  client.post("keep", "a");
  ASSERT_TRUE(this->letKeepOne());

  this->delegate_.object()->answerKept("late");

  const auto answer = client.answer();
  ASSERT_TRUE(answer.has_value());
  EXPECT_EQ(answer->text, "late");
}

TYPED_TEST_P(ConnectionContract, AnswerToAClientThatHasGoneDoesNothing) {
  auto client = this->connect();
  client.post("keep", "a");
  ASSERT_TRUE(this->letKeepOne());
  const std::shared_ptr<ContractObject> object = this->delegate_.object();
  client.leave();
  ASSERT_TRUE(this->harness_.letHappen([&] { return this->delegate_.events().size() == 3; }));

  object->answerKept("too late");

  auto other = this->connect();
  EXPECT_EQ(this->call(other, "echo", "still here").text, "still here");
}

TYPED_TEST_P(ConnectionContract, ClientThatVanishesIsInterruptedThenInvalidated) {
  auto client = this->connect();
  this->call(client, "echo", "a");

  client.leave();

  ASSERT_TRUE(this->harness_.letHappen([&] { return this->delegate_.events().size() >= 3; }));
  EXPECT_THAT(this->delegate_.events(),
              ::testing::ElementsAre("asked", "interrupted", "invalidated"));
}

TYPED_TEST_P(ConnectionContract, ObjectIsHeldUntilItsConnectionHasEnded) {
  auto client = this->connect();
  this->call(client, "echo", "a");
  EXPECT_NE(this->delegate_.object(), nullptr);

  client.leave();

  EXPECT_TRUE(this->harness_.letHappen([&] { return this->delegate_.object() == nullptr; }));
}

TYPED_TEST_P(ConnectionContract, RefusedConnectionLetsGoOfItsObjectAndCallsNoHandler) {
  this->delegate_.refuse();
  auto client = this->connect();

  ASSERT_TRUE(this->harness_.letHappen(
      [&] { return !this->delegate_.events().empty() && this->delegate_.object() == nullptr; }));
  client.leave();
  this->harness_.end();

  EXPECT_THAT(this->delegate_.events(), ::testing::ElementsAre("asked"));
}

TYPED_TEST_P(ConnectionContract, RequestForTheOwnerIsDeliveredFromTheOwner) {
  auto client = this->connect();

  EXPECT_EQ(this->call(client, "end", "a").text, "a");
}

TYPED_TEST_P(ConnectionContract, RequestForTheOwnerIsRefusedToOthersAndNotDelivered) {
  if (!this->harness_.canBe(ContractUser::kStranger)) GTEST_SKIP() << "cannot be another user";
  auto client = this->harness_.connect(ContractUser::kStranger);

  EXPECT_EQ(this->call(client, "end", "a").errorName, "org.freedesktop.DBus.Error.AccessDenied");

  EXPECT_EQ(this->delegate_.object()->seen().size(), 0U);
  EXPECT_EQ(this->call(client, "echo", "b").text, "b");
}

REGISTER_TYPED_TEST_SUITE_P(
    ConnectionContract, DelegateIsAskedOnceForEachClientWhoseProcessIsKnown,
    RequestReachesTheObjectAndItsAnswerTheClient, ErrorReachesTheClientUnderItsName,
    RequestsOfAClientComeInTheirOrder, RequestNamesItsSenderAndHasATokenOfItsOwn,
    LateAnswerOfAnotherThreadReachesTheClient, AnswerToAClientThatHasGoneDoesNothing,
    ClientThatVanishesIsInterruptedThenInvalidated, ObjectIsHeldUntilItsConnectionHasEnded,
    RefusedConnectionLetsGoOfItsObjectAndCallsNoHandler, RequestForTheOwnerIsDeliveredFromTheOwner,
    RequestForTheOwnerIsRefusedToOthersAndNotDelivered);

}  // namespace halvox::platform::contract
