#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <string>

#include <gtest/gtest.h>

#include "platform/dispatch.h"
#include "platform/notify.h"

namespace halvox::platform::contract {

// What every NotifyService promises. `Harness` has
//   NotifyService& service();
//   std::shared_ptr<DispatchQueue> queue();
//   void post(const std::string& name);
//   bool letRunUntil(const std::function<bool()>& condition);  // false if it never becomes true
template <typename Harness>
class NotifyContract : public ::testing::Test {
 protected:
  static constexpr const char* kName = "org.example.changed";

  // A registration, and the calls of its handler.
  struct Listener {
    NotifyStatus status = 0;
    NotifyToken token = 0;
    std::atomic<int> calls{0};
    std::atomic<NotifyToken> got{0};
  };

  std::shared_ptr<Listener> listen(const std::string& name) {
    auto listener = std::make_shared<Listener>();
    listener->status = harness_.service().notify_register_dispatch(
        name, listener->token, harness_.queue(), [listener](NotifyToken token) {
          listener->got = token;
          ++listener->calls;
        });
    return listener;
  }
  // Posts the name, one post after the other, until the listener has been called `calls` times.
  bool letHear(const Listener& listener, const std::string& name, int calls) {
    for (int call = listener.calls + 1; call <= calls; ++call) {
      harness_.post(name);
      if (!harness_.letRunUntil([&] { return listener.calls >= call; })) return false;
    }
    return true;
  }

  Harness harness_;
};
TYPED_TEST_SUITE_P(NotifyContract);

TYPED_TEST_P(NotifyContract, HandlerIsCalledAfterEachPostWithTheTokenOfItsRegistration) {
  const auto listener = this->listen(this->kName);

  EXPECT_EQ(listener->status, 0U);
  EXPECT_TRUE(this->letHear(*listener, this->kName, 3));
  EXPECT_EQ(listener->got, listener->token);
}

TYPED_TEST_P(NotifyContract, EachRegistrationHasATokenOfItsOwn) {
  const auto first = this->listen(this->kName);
  const auto second = this->listen(this->kName);

  EXPECT_NE(first->token, 0);
  EXPECT_NE(second->token, 0);
  EXPECT_NE(first->token, second->token);
}

TYPED_TEST_P(NotifyContract, AllThatRegisteredForANameHearOfIt) {
  const auto first = this->listen(this->kName);
  const auto second = this->listen(this->kName);

  this->harness_.post(this->kName);

  EXPECT_TRUE(this->harness_.letRunUntil([&] { return first->calls >= 1 && second->calls >= 1; }));
  EXPECT_EQ(first->got, first->token);
  EXPECT_EQ(second->got, second->token);
}

TYPED_TEST_P(NotifyContract, OtherNamesAreNotHeard) {
  const auto other = this->listen("org.example.changed.more");
  const auto listener = this->listen(this->kName);

  ASSERT_TRUE(this->letHear(*listener, this->kName, 2));

  EXPECT_EQ(other->calls, 0);
}

TYPED_TEST_P(NotifyContract, PostBeforeTheRegistrationIsNotHeard) {
  const auto earlier = this->listen(this->kName);
  ASSERT_TRUE(this->letHear(*earlier, this->kName, 1));

  const auto listener = this->listen(this->kName);
  const auto fence = this->listen("org.example.fence");
  ASSERT_TRUE(this->letHear(*fence, "org.example.fence", 1));

  EXPECT_EQ(listener->calls, 0);
}

TYPED_TEST_P(NotifyContract, NameThatCannotBeIsRefusedAndLeavesTheTokenAlone) {
  for (const std::string& name :
       {std::string(), std::string(".."), std::string("a/b"), std::string("a\0b", 3)}) {
    NotifyToken token = 77;
    EXPECT_NE(this->harness_.service().notify_register_dispatch(name, token, this->harness_.queue(),
                                                                [](NotifyToken) {}),
              0U)
        << name;
    EXPECT_EQ(token, 77);
  }
}

REGISTER_TYPED_TEST_SUITE_P(NotifyContract,
                            HandlerIsCalledAfterEachPostWithTheTokenOfItsRegistration,
                            EachRegistrationHasATokenOfItsOwn, AllThatRegisteredForANameHearOfIt,
                            OtherNamesAreNotHeard, PostBeforeTheRegistrationIsNotHeard,
                            NameThatCannotBeIsRefusedAndLeavesTheTokenAlone);

}  // namespace halvox::platform::contract
