#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/ktrace.h"

namespace halvox::platform::contract {

// What every KtraceService promises.
//
// `Harness` is default-constructible and has
//   KtraceService& service();
//   std::shared_ptr<DispatchQueue> createQueue();
//   bool letRunUntil(const std::function<bool()>& condition);
//     lets queues run until the condition holds; false if it never does
//   void emit(const std::vector<std::uint32_t>& codes);
//     lets a program emit these events in this order, each later than the one before; recordings
//     have them when this returns
//   std::size_t recordings();  the number of recordings in the tracer
//   void breakTracer();        prevents recordings from starting; called before the first start
template <typename Harness>
class KtraceContract : public ::testing::Test {
 protected:
  static constexpr std::uint32_t kLow = 0x21040010;
  static constexpr std::uint32_t kHigh = 0x21040014;
  using Codes = std::vector<std::uint32_t>;

  // What the handlers of one session received. The session's queue writes it; read it after
  // `ended`.
  struct Seen {
    std::vector<trace_point> events;
    std::atomic<int> completions{0};
    bool isElsewhere = false;  // a handler ran outside of the queue, or after the completion

    [[nodiscard]] Codes codes() const {
      Codes codes;
      for (const trace_point& event : events) codes.push_back(event.debugid);
      return codes;
    }
  };

  KtraceService& service() { return harness_.service(); }
  KtraceService::EventHandler seeInto(Seen& seen) {
    return [this, &seen](const trace_point& event) {
      seen.isElsewhere = seen.isElsewhere || !queue_->isCurrent() || seen.completions > 0;
      seen.events.push_back(event);
    };
  }
  KtraceService::Session create(Seen& seen) {
    auto session = service().ktrace_session_create();
    service().ktrace_set_completion_handler(session, [this, &seen] {
      seen.isElsewhere = seen.isElsewhere || !queue_->isCurrent();
      ++seen.completions;
    });
    return session;
  }
  KtraceService::Session createWithRange(Seen& seen) {
    auto session = create(seen);
    EXPECT_EQ(service().ktrace_events_range(session, kLow, kHigh, seeInto(seen)), 0);
    return session;
  }
  // A session that is started and has recorded one event.
  KtraceService::Session recordOneEvent(Seen& seen) {
    auto session = createWithRange(seen);
    EXPECT_EQ(start(session), 0);
    harness_.emit({kLow});
    return session;
  }
  // The calls that a session's owner makes on its queue.
  void onQueue(std::function<void()> work) {
    std::atomic<bool> isDone{false};
    queue_->async(JobWeight::kMayBlock, [&] {
      work();
      isDone = true;
    });
    ASSERT_TRUE(harness_.letRunUntil([&] { return isDone.load(); }));
  }
  int start(const KtraceService::Session& session) {
    int result = 0;
    onQueue([&] { result = service().ktrace_start(session, queue_); });
    return result;
  }
  void end(const KtraceService::Session& session) {
    onQueue([&] { service().ktrace_end(session, 0); });
  }
  void destroy(const KtraceService::Session& session) {
    onQueue([&] { service().ktrace_session_destroy(session); });
  }
  void endAndWait(const KtraceService::Session& session, const Seen& seen) {
    end(session);
    ASSERT_TRUE(harness_.letRunUntil([&] { return seen.completions > 0; }));
    EXPECT_FALSE(seen.isElsewhere);
  }
  // Creates, starts and ends another session. After that, no job of an earlier session can be
  // pending.
  void letLifePass() {
    Seen other;
    const auto session = create(other);
    start(session);
    endAndWait(session, other);
    destroy(session);
  }

  Harness harness_;
  const std::shared_ptr<DispatchQueue> queue_ = harness_.createQueue();
};
TYPED_TEST_SUITE_P(KtraceContract);

// --- Calls that the state does not allow --------------------------------------------------------

TYPED_TEST_P(KtraceContract, NoSessionIsHarmless) {
  KtraceService& service = this->service();

  service.ktrace_set_completion_handler(nullptr, [] {});
  service.ktrace_set_walltimes_enabled(nullptr, true);
  EXPECT_NE(service.ktrace_events_range(nullptr, 1, 2, nullptr), 0);
  EXPECT_NE(service.ktrace_start(nullptr, this->queue_), 0);
  service.ktrace_end(nullptr, 0);
  service.ktrace_session_destroy(nullptr);
  EXPECT_EQ(service.ktrace_convert_timestamp_to_nanoseconds(nullptr, 7), 7U);
}

TYPED_TEST_P(KtraceContract, EndOfASessionThatWasNeverStartedIsHarmless) {
  typename TestFixture::Seen seen;
  const auto session = this->createWithRange(seen);

  this->service().ktrace_end(session, 0);
  this->letLifePass();
  EXPECT_EQ(seen.completions, 0);

  EXPECT_EQ(this->start(session), 0);
  this->endAndWait(session, seen);
  this->destroy(session);
}

TYPED_TEST_P(KtraceContract, SessionStartsOnceAndNeedsAQueue) {
  typename TestFixture::Seen seen;
  const auto session = this->createWithRange(seen);

  EXPECT_NE(this->service().ktrace_start(session, nullptr), 0);
  EXPECT_EQ(this->start(session), 0);
  EXPECT_NE(this->start(session), 0);
  EXPECT_EQ(this->harness_.recordings(), 1U);
  this->endAndWait(session, seen);

  EXPECT_NE(this->start(session), 0);
  EXPECT_EQ(this->harness_.recordings(), 0U);
  this->destroy(session);
}

TYPED_TEST_P(KtraceContract, SessionThatWasStartedIsNotSetUpAnyMore) {
  typename TestFixture::Seen seen;
  const auto session = this->createWithRange(seen);
  EXPECT_EQ(this->start(session), 0);

  this->onQueue([&] {
    this->service().ktrace_set_completion_handler(session, [] { FAIL(); });
    EXPECT_NE(this->service().ktrace_events_range(session, 1, 2, nullptr), 0);
  });

  this->endAndWait(session, seen);
  this->destroy(session);
}

TYPED_TEST_P(KtraceContract, RangeUpsideDownIsAnError) {
  typename TestFixture::Seen seen;
  const auto session = this->create(seen);

  EXPECT_NE(this->service().ktrace_events_range(session, 2, 1, this->seeInto(seen)), 0);
}

TYPED_TEST_P(KtraceContract, SecondEndDoesNothing) {
  typename TestFixture::Seen seen;
  const auto session = this->recordOneEvent(seen);

  this->onQueue([&] {
    this->service().ktrace_end(session, 0);
    this->service().ktrace_end(session, 0);
  });
  ASSERT_TRUE(this->harness_.letRunUntil([&] { return seen.completions > 0; }));
  this->end(session);
  this->letLifePass();

  EXPECT_EQ(seen.completions, 1);
  EXPECT_EQ(seen.events.size(), 1U);
  this->destroy(session);
}

TYPED_TEST_P(KtraceContract, DestroyedSessionDoesNothingAnyMore) {
  typename TestFixture::Seen seen;
  const auto session = this->createWithRange(seen);
  this->destroy(session);
  this->destroy(session);

  EXPECT_NE(this->start(session), 0);
  this->end(session);
  this->letLifePass();

  EXPECT_EQ(seen.completions, 0);
  EXPECT_EQ(this->harness_.recordings(), 0U);
}

TYPED_TEST_P(KtraceContract, FailedStartDeliversNothingButTheCompletion) {
  this->harness_.breakTracer();
  typename TestFixture::Seen seen;
  const auto session = this->createWithRange(seen);

  EXPECT_NE(this->start(session), 0);
  this->harness_.emit({this->kLow});
  EXPECT_EQ(seen.completions, 0);
  this->endAndWait(session, seen);

  EXPECT_TRUE(seen.events.empty());
  EXPECT_EQ(seen.completions, 1);
  this->destroy(session);
}

// --- Recording ----------------------------------------------------------------------------------

TYPED_TEST_P(KtraceContract, EventsOfTheRangeComeInTheirOrderAndThenTheCompletion) {
  typename TestFixture::Seen seen;
  const auto session = this->createWithRange(seen);
  this->harness_.emit({this->kLow});
  EXPECT_EQ(this->start(session), 0);
  EXPECT_EQ(this->harness_.recordings(), 1U);

  this->harness_.emit(
      {this->kLow - 1, this->kHigh, this->kLow, this->kHigh + 1, this->kLow + 2, this->kLow});
  this->endAndWait(session, seen);
  this->harness_.emit({this->kLow});

  EXPECT_EQ(seen.codes(),
            (typename TestFixture::Codes{this->kHigh, this->kLow, this->kLow + 2, this->kLow}));
  EXPECT_EQ(seen.completions, 1);
  EXPECT_EQ(this->harness_.recordings(), 0U);
  this->destroy(session);
}

TYPED_TEST_P(KtraceContract, LaterEventsHaveLaterTimes) {
  typename TestFixture::Seen seen;
  const auto session = this->createWithRange(seen);
  this->start(session);
  this->harness_.emit({this->kLow, this->kHigh, this->kLow});
  this->endAndWait(session, seen);

  ASSERT_EQ(seen.events.size(), 3U);
  const auto nanoseconds = [&](const trace_point& event) {
    return this->service().ktrace_convert_timestamp_to_nanoseconds(session, event.timestamp);
  };
  for (std::size_t index = 1; index < seen.events.size(); ++index) {
    EXPECT_LT(nanoseconds(seen.events[index - 1]), nanoseconds(seen.events[index]));
    EXPECT_EQ(seen.events[index].threadid, seen.events[0].threadid);
  }
  this->destroy(session);
}

TYPED_TEST_P(KtraceContract, EachRangeHasItsOwnHandler) {
  typename TestFixture::Seen first;
  typename TestFixture::Seen second;
  const auto session = this->createWithRange(first);
  EXPECT_EQ(this->service().ktrace_events_range(session, this->kHigh + 1, this->kHigh + 1,
                                                this->seeInto(second)),
            0);
  this->start(session);
  this->harness_.emit({this->kHigh + 1, this->kLow, this->kHigh + 2});
  this->endAndWait(session, first);

  EXPECT_EQ(first.codes(), typename TestFixture::Codes{this->kLow});
  EXPECT_EQ(second.codes(), typename TestFixture::Codes{this->kHigh + 1});
  this->destroy(session);
}

TYPED_TEST_P(KtraceContract, WallTimesComeOnlyWhenTheyWereAskedFor) {
  for (const bool isAskedFor : {true, false}) {
    typename TestFixture::Seen seen;
    const auto session = this->createWithRange(seen);
    this->service().ktrace_set_walltimes_enabled(session, isAskedFor);
    this->start(session);
    this->harness_.emit({this->kLow});
    this->endAndWait(session, seen);

    ASSERT_EQ(seen.events.size(), 1U);
    EXPECT_EQ(seen.events[0].walltime > 1e9, isAskedFor) << seen.events[0].walltime;
    this->destroy(session);
  }
}

TYPED_TEST_P(KtraceContract, SessionsRecordBesideEachOther) {
  typename TestFixture::Seen first;
  typename TestFixture::Seen second;
  const auto one = this->createWithRange(first);
  const auto other = this->createWithRange(second);
  this->start(one);
  this->harness_.emit({this->kLow});
  this->start(other);
  this->harness_.emit({this->kHigh});
  this->endAndWait(one, first);
  this->harness_.emit({this->kLow + 1});
  this->endAndWait(other, second);

  EXPECT_EQ(first.codes(), (typename TestFixture::Codes{this->kLow, this->kHigh}));
  EXPECT_EQ(second.codes(), (typename TestFixture::Codes{this->kHigh, this->kLow + 1}));
  this->destroy(one);
  this->destroy(other);
}

// --- Destroying ---------------------------------------------------------------------------------

TYPED_TEST_P(KtraceContract, DestroyWhileItRecordsEndsItWithoutAWord) {
  typename TestFixture::Seen seen;
  const auto session = this->recordOneEvent(seen);

  this->destroy(session);
  EXPECT_EQ(this->harness_.recordings(), 0U);
  this->letLifePass();

  EXPECT_TRUE(seen.events.empty());
  EXPECT_EQ(seen.completions, 0);
}

TYPED_TEST_P(KtraceContract, DestroyBehindTheEndKeepsTheRestBack) {
  typename TestFixture::Seen seen;
  const auto session = this->recordOneEvent(seen);

  this->onQueue([&] {
    this->service().ktrace_end(session, 0);
    this->service().ktrace_session_destroy(session);
  });
  this->letLifePass();

  EXPECT_TRUE(seen.events.empty());
  EXPECT_EQ(seen.completions, 0);
  EXPECT_EQ(this->harness_.recordings(), 0U);
}

TYPED_TEST_P(KtraceContract, DestroyLetsGoOfWhatTheHandlersHeld) {
  auto held = std::make_shared<int>(1);
  const std::weak_ptr<int> watched = held;
  const auto session = this->service().ktrace_session_create();
  this->service().ktrace_set_completion_handler(session, [held] {});
  this->service().ktrace_events_range(session, 1, 2, [held](const trace_point&) {});
  held.reset();
  EXPECT_FALSE(watched.expired());

  this->destroy(session);

  EXPECT_TRUE(watched.expired());
}

TYPED_TEST_P(KtraceContract, CompletionMayDestroyItsSession) {
  std::atomic<bool> isComplete{false};
  const auto session = this->service().ktrace_session_create();
  this->service().ktrace_set_completion_handler(session, [&, big = std::vector<int>(100, 7)] {
    this->service().ktrace_session_destroy(session);
    isComplete = big[99] == 7;
  });
  this->start(session);

  this->end(session);

  EXPECT_TRUE(this->harness_.letRunUntil([&] { return isComplete.load(); }));
}

REGISTER_TYPED_TEST_SUITE_P(
    KtraceContract, NoSessionIsHarmless, EndOfASessionThatWasNeverStartedIsHarmless,
    SessionStartsOnceAndNeedsAQueue, SessionThatWasStartedIsNotSetUpAnyMore,
    RangeUpsideDownIsAnError, SecondEndDoesNothing, DestroyedSessionDoesNothingAnyMore,
    FailedStartDeliversNothingButTheCompletion,
    EventsOfTheRangeComeInTheirOrderAndThenTheCompletion, LaterEventsHaveLaterTimes,
    EachRangeHasItsOwnHandler, WallTimesComeOnlyWhenTheyWereAskedFor, SessionsRecordBesideEachOther,
    DestroyWhileItRecordsEndsItWithoutAWord, DestroyBehindTheEndKeepsTheRestBack,
    DestroyLetsGoOfWhatTheHandlersHeld, CompletionMayDestroyItsSession);

}  // namespace halvox::platform::contract
