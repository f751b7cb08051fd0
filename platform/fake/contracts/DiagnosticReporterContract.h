#pragma once

#include <algorithm>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/diagnostic_reporter.h"

namespace halvox::platform::contract {

// What every DiagnosticReporterService promises.
//
// `Harness` is default-constructible and has
//   DiagnosticReporterService& service();
//   bool letReply(const std::function<bool()>& condition);
//     lets the replies to all requests arrive; false if the condition never becomes true
//   void end();  ends the service; no reply arrives afterwards
template <typename Harness>
class DiagnosticReporterContract : public ::testing::Test {
 protected:
  ~DiagnosticReporterContract() override { harness_.end(); }

  static Dictionary signature(const AILDiagnosticReporter& reporter,
                              std::optional<std::string_view> process = "player",
                              const std::optional<Dictionary>& thresholds = std::nullopt) {
    return reporter.makeSignature("Acoustat", "haptics", "Session_Generic", "Joulebook", process,
                                  thresholds);
  }
  static bool holdsText(const Dictionary& dictionary, std::string_view text) {
    return std::any_of(dictionary.begin(), dictionary.end(), [text](const auto& entry) {
      return entry.value.isString() && entry.value.string() == text;
    });
  }
  void request(AILDiagnosticReporter& reporter) {
    reporter.requestSnapshot(signature(reporter), 0, std::nullopt, std::nullopt,
                             [this, requester = std::this_thread::get_id()](const Dictionary&) {
                               const std::lock_guard held(mutex_);
                               ++replies_;
                               isWithinRequest_ |=
                                   isRequesting_ && std::this_thread::get_id() == requester;
                             });
  }
  int replies() {
    const std::lock_guard held(mutex_);
    return replies_;
  }

  std::mutex mutex_;
  int replies_ = 0;
  bool isRequesting_ = false;
  bool isWithinRequest_ = false;
  Harness harness_;
};
TYPED_TEST_SUITE_P(DiagnosticReporterContract);

TYPED_TEST_P(DiagnosticReporterContract, EachReporterIsOneOfItsOwn) {
  const auto first = this->harness_.service().createReporter();
  const auto second = this->harness_.service().createReporter();

  ASSERT_NE(first, nullptr);
  EXPECT_NE(first, second);
}

TYPED_TEST_P(DiagnosticReporterContract, SignatureHasAllThatWasGiven) {
  const auto reporter = this->harness_.service().createReporter();

  const Dictionary signature = this->signature(*reporter, "player", Dictionary{{"limit", 1}});

  for (const char* text : {"Acoustat", "haptics", "Session_Generic", "Joulebook", "player"}) {
    EXPECT_TRUE(this->holdsText(signature, text)) << text;
  }
  EXPECT_EQ(signature.size(), 6U);
  EXPECT_TRUE(std::any_of(signature.begin(), signature.end(), [](const auto& entry) {
    return entry.value == Value(Dictionary{{"limit", 1}});
  }));
}

TYPED_TEST_P(DiagnosticReporterContract, SignatureHasNothingForWhatIsNotKnown) {
  const auto reporter = this->harness_.service().createReporter();

  EXPECT_EQ(this->signature(*reporter, "player").size(), 5U);
  EXPECT_EQ(this->signature(*reporter, std::nullopt).size(), 4U);
}

TYPED_TEST_P(DiagnosticReporterContract, EqualProblemsHaveEqualSignatures) {
  const auto first = this->harness_.service().createReporter();
  const auto second = this->harness_.service().createReporter();

  EXPECT_EQ(this->signature(*first), this->signature(*second));
  EXPECT_NE(this->signature(*first), this->signature(*first, "recorder"));
}

TYPED_TEST_P(DiagnosticReporterContract, ReplyComesOnceAndNotWithinTheRequest) {
  const auto reporter = this->harness_.service().createReporter();

  this->isRequesting_ = true;
  this->request(*reporter);
  {
    const std::lock_guard held(this->mutex_);
    this->isRequesting_ = false;
  }

  ASSERT_TRUE(this->harness_.letReply([this] { return this->replies() > 0; }));
  this->harness_.end();
  EXPECT_EQ(this->replies(), 1);
  EXPECT_FALSE(this->isWithinRequest_);
}

TYPED_TEST_P(DiagnosticReporterContract, EveryRequestOfABurstIsReplied) {
  constexpr int kBurst = 5;
  const auto reporter = this->harness_.service().createReporter();

  for (int count = 0; count < kBurst; ++count) this->request(*reporter);

  ASSERT_TRUE(this->harness_.letReply([this] { return this->replies() >= kBurst; }));
  this->harness_.end();
  EXPECT_EQ(this->replies(), kBurst);
}

TYPED_TEST_P(DiagnosticReporterContract, ReplyComesThoughTheReporterHasGone) {
  auto reporter = this->harness_.service().createReporter();
  this->request(*reporter);
  reporter.reset();

  EXPECT_TRUE(this->harness_.letReply([this] { return this->replies() == 1; }));
}

TYPED_TEST_P(DiagnosticReporterContract, SourceOfTheStateHoldsUpNoReply) {
  this->harness_.service().setStateSource(
      [](const std::function<void(const Dictionary&)>& callback) {
        callback({{"clients", 0}});
      });
  const auto reporter = this->harness_.service().createReporter();

  this->request(*reporter);

  EXPECT_TRUE(this->harness_.letReply([this] { return this->replies() == 1; }));
}

REGISTER_TYPED_TEST_SUITE_P(DiagnosticReporterContract, EachReporterIsOneOfItsOwn,
                            SignatureHasAllThatWasGiven, SignatureHasNothingForWhatIsNotKnown,
                            EqualProblemsHaveEqualSignatures, ReplyComesOnceAndNotWithinTheRequest,
                            EveryRequestOfABurstIsReplied, ReplyComesThoughTheReporterHasGone,
                            SourceOfTheStateHoldsUpNoReply);

}  // namespace halvox::platform::contract
