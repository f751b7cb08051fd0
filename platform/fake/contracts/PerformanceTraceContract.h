#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/performance_trace.h"

namespace halvox::platform::contract {

// What every PerformanceTraceService promises.
//
// `Harness` is default-constructible and has
//   PerformanceTraceService& service();
//   bool letRunUntil(const std::function<bool()>& condition);
//     lets the service work until the condition holds; false if it never does
//   std::size_t recordings();  the number of recordings in the tracer
//   void breakTracer();        prevents recordings from starting
//   void breakRecorder();      makes the end of the current recordings fail
//   void breakSaving();        makes saving a finished trace fail
template <typename Harness>
class PerformanceTraceContract : public ::testing::Test {
 protected:
  using Texts = std::vector<std::string>;
  using Session = std::shared_ptr<KQTraceSession>;

  // Keeps the names of its calls.
  class Listener final : public KQTraceSessionDelegate {
   public:
    void kqTraceDidStart(const std::optional<Error>& error) override {
      add(error ? "no start" : "start");
    }
    void kqTraceDidStop(const std::optional<Error>& error) override {
      add(error ? "no stop" : "stop");
    }
    void kqTraceDidComplete(const std::string& url, std::uint64_t /*token*/,
                            const std::optional<Error>& error) override {
      const std::lock_guard lock(mutex_);
      url_ = url;
      heard_.push_back(error ? "failure" : "completion");
      wasWithinACall_ = wasWithinACall_ || isCalling;
    }
    [[nodiscard]] Texts heard() const {
      const std::lock_guard lock(mutex_);
      EXPECT_FALSE(wasWithinACall_);
      return heard_;
    }
    [[nodiscard]] std::string url() const {
      const std::lock_guard lock(mutex_);
      return url_;
    }

    static inline thread_local bool isCalling = false;

   private:
    void add(std::string text) {
      const std::lock_guard lock(mutex_);
      heard_.push_back(std::move(text));
      wasWithinACall_ = wasWithinACall_ || isCalling;
    }

    mutable std::mutex mutex_;
    Texts heard_;
    std::string url_;
    bool wasWithinACall_ = false;
  };

  Session create(const std::shared_ptr<Listener>& listener) {
    PerformanceTraceService& service = harness_.service();
    auto session = service.initWithConfig(
        service.configWithTemplate(PerformanceTraceService::kStandardTemplate));
    if (session != nullptr) session->setDelegate(listener);
    return session;
  }
  static void start(const Session& session) {
    Listener::isCalling = true;
    session->startKQTrace();
    Listener::isCalling = false;
  }
  static void stop(const Session& session) {
    Listener::isCalling = true;
    session->stopKQTrace();
    Listener::isCalling = false;
  }
  bool hears(const std::shared_ptr<Listener>& listener, const Texts& texts) {
    const bool isHeard =
        harness_.letRunUntil([&] { return listener->heard().size() >= texts.size(); });
    EXPECT_EQ(listener->heard(), texts);
    return isHeard;
  }
  // Starts another trace and waits for its outcome, which comes after the outcomes of all earlier
  // calls.
  void letWorkPass() {
    const auto other = std::make_shared<Listener>();
    const Session session = create(other);
    start(session);
    ASSERT_TRUE(harness_.letRunUntil([&] { return !other->heard().empty(); }));
  }

  Harness harness_;
  std::shared_ptr<Listener> listener_ = std::make_shared<Listener>();
};
TYPED_TEST_SUITE_P(PerformanceTraceContract);

TYPED_TEST_P(PerformanceTraceContract, TraceIsHeardOfFromItsStartToItsCompletion) {
  const auto session = this->create(this->listener_);
  EXPECT_EQ(this->harness_.recordings(), 0U);

  this->start(session);
  ASSERT_TRUE(this->hears(this->listener_, {"start"}));
  EXPECT_EQ(this->harness_.recordings(), 1U);
  this->stop(session);

  ASSERT_TRUE(this->hears(this->listener_, {"start", "stop", "completion"}));
  EXPECT_TRUE(this->listener_->url().starts_with("file:///")) << this->listener_->url();
  EXPECT_EQ(this->harness_.recordings(), 0U);
}

TYPED_TEST_P(PerformanceTraceContract, StopRightBehindTheStartIsCarriedOutAfterIt) {
  const auto session = this->create(this->listener_);

  this->start(session);
  this->stop(session);

  EXPECT_TRUE(this->hears(this->listener_, {"start", "stop", "completion"}));
}

TYPED_TEST_P(PerformanceTraceContract, EachTraceHasItsOwnURL) {
  const auto first = this->create(this->listener_);
  this->start(first);
  this->stop(first);
  const auto otherListener = std::make_shared<typename TestFixture::Listener>();
  const auto second = this->create(otherListener);
  this->start(second);
  this->stop(second);
  ASSERT_TRUE(this->hears(this->listener_, {"start", "stop", "completion"}));
  ASSERT_TRUE(this->hears(otherListener, {"start", "stop", "completion"}));

  EXPECT_NE(this->listener_->url(), otherListener->url());
}

TYPED_TEST_P(PerformanceTraceContract, WhatDoesNotSuitTheStateIsNotHeardOf) {
  const auto session = this->create(this->listener_);

  this->stop(session);
  this->start(session);
  this->start(session);
  this->stop(session);
  this->stop(session);
  ASSERT_TRUE(this->hears(this->listener_, {"start", "stop", "completion"}));
  this->letWorkPass();

  EXPECT_EQ(this->listener_->heard().size(), 3U);
}

TYPED_TEST_P(PerformanceTraceContract, TraceWhoseStartFailedNeverCompletes) {
  this->harness_.breakTracer();
  const auto session = this->create(this->listener_);

  this->start(session);
  ASSERT_TRUE(this->hears(this->listener_, {"no start"}));
  this->stop(session);
  this->letWorkPass();

  EXPECT_EQ(this->listener_->heard().size(), 1U);
  EXPECT_EQ(this->harness_.recordings(), 0U);
}

TYPED_TEST_P(PerformanceTraceContract, TraceThatCannotBeEndedWellCompletesOnceWithAnError) {
  const auto session = this->create(this->listener_);
  this->start(session);
  ASSERT_TRUE(this->hears(this->listener_, {"start"}));
  this->harness_.breakRecorder();

  this->stop(session);

  EXPECT_TRUE(this->hears(this->listener_, {"start", "no stop", "failure"}));
}

TYPED_TEST_P(PerformanceTraceContract, TraceThatCannotBeSavedCompletesOnceWithAnError) {
  const auto session = this->create(this->listener_);
  this->start(session);
  ASSERT_TRUE(this->hears(this->listener_, {"start"}));
  this->harness_.breakSaving();

  this->stop(session);

  EXPECT_TRUE(this->hears(this->listener_, {"start", "stop", "failure"}));
  EXPECT_EQ(this->harness_.recordings(), 0U);
}

TYPED_TEST_P(PerformanceTraceContract, WithoutADelegateNothingIsHeardAndTheTraceEnds) {
  const auto session = this->create(this->listener_);
  this->start(session);
  ASSERT_TRUE(this->hears(this->listener_, {"start"}));

  session->setDelegate({});
  this->stop(session);

  EXPECT_TRUE(this->harness_.letRunUntil([&] { return this->harness_.recordings() == 0; }));
  this->letWorkPass();
  EXPECT_EQ(this->listener_->heard().size(), 1U);
}

TYPED_TEST_P(PerformanceTraceContract, DelegateIsNotKept) {
  const auto session = this->create(this->listener_);
  const std::weak_ptr<typename TestFixture::Listener> watched = this->listener_;
  this->start(session);
  this->listener_.reset();
  EXPECT_TRUE(watched.expired());

  this->stop(session);

  this->letWorkPass();
  EXPECT_TRUE(this->harness_.letRunUntil([&] { return this->harness_.recordings() <= 1; }));
}

TYPED_TEST_P(PerformanceTraceContract, RecordingEndsWithItsLastHolder) {
  auto session = this->create(this->listener_);
  this->start(session);
  ASSERT_TRUE(this->hears(this->listener_, {"start"}));

  session.reset();

  EXPECT_TRUE(this->harness_.letRunUntil([&] { return this->harness_.recordings() == 0; }));
  EXPECT_EQ(this->listener_->heard().size(), 1U);
}

TYPED_TEST_P(PerformanceTraceContract, TraceThatNobodyHoldsBeforeItHasStartedDoesNotGoOn) {
  auto session = this->create(this->listener_);

  this->start(session);
  session.reset();
  ASSERT_TRUE(this->hears(this->listener_, {"start"}));

  EXPECT_TRUE(this->harness_.letRunUntil([&] { return this->harness_.recordings() == 0; }));
}

REGISTER_TYPED_TEST_SUITE_P(PerformanceTraceContract, TraceIsHeardOfFromItsStartToItsCompletion,
                            StopRightBehindTheStartIsCarriedOutAfterIt, EachTraceHasItsOwnURL,
                            WhatDoesNotSuitTheStateIsNotHeardOf,
                            TraceWhoseStartFailedNeverCompletes,
                            TraceThatCannotBeEndedWellCompletesOnceWithAnError,
                            TraceThatCannotBeSavedCompletesOnceWithAnError,
                            WithoutADelegateNothingIsHeardAndTheTraceEnds, DelegateIsNotKept,
                            RecordingEndsWithItsLastHolder,
                            TraceThatNobodyHoldsBeforeItHasStartedDoesNotGoOn);

}  // namespace halvox::platform::contract
