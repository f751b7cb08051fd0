#pragma once

#include <limits>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakeIOReportService.h"
#include "platform/ioreport.h"

namespace halvox::platform::contract {

// What every IOReportService promises.
//
// `Harness` is default-constructible and has
//   IOReportService& service();
//   void set(FakeIOReportService::ChannelList channels);
//                                sets the channels of the drivers and their values
// The groups and subgroups that the suite uses are those of kIOReportGroups.
using ChannelOfDriver = FakeIOReportService::Channel;

struct GroupAndSubGroup {
  std::optional<std::string> group{};
  std::optional<std::string> subGroup{};
};
inline const std::vector<GroupAndSubGroup> kIOReportGroups{
    {"Speaker", std::nullopt}, {std::nullopt, "MCA"}, {"Rx", "MCA"}, {"Tx", std::nullopt}};

// Shared by the tests of the suite.
template <typename Harness>
class IOReportContract : public ::testing::Test {
 protected:
  using Texts = std::vector<std::string>;
  using ChannelList = FakeIOReportService::ChannelList;

  static ChannelOfDriver counter(std::int64_t value) {
    return {.driverName = "Amp<1>",
            .group = "Speaker",
            .subGroup = "Stats",
            .channelName = "pulses",
            .unitLabel = "pulses",
            .integerValue = value};
  }
  static ChannelOfDriver gauge(std::int64_t value) {
    ChannelOfDriver channel = counter(value);
    channel.kind = IOReportKind::kGauge;
    return channel;
  }
  static ChannelOfDriver states(std::uint64_t transitions, std::uint64_t on, std::uint64_t off) {
    ChannelOfDriver channel = counter(0);
    channel.format = IOReportFormat::kState;
    channel.states = {{.name = "on", .inTransitions = transitions, .residency = on},
                      {.name = "off", .inTransitions = 0, .residency = off}};
    return channel;
  }
  // Buckets [0, 10), [10, 20) and an open one from 20.
  static ChannelOfDriver histogram(std::vector<std::uint64_t> hits) {
    ChannelOfDriver channel = counter(0);
    channel.format = IOReportFormat::kHistogram;
    channel.buckets = {{0, 10, hits[0]}, {10, 20, hits[1]}, {20, kIOReportNoUpperBound, hits[2]}};
    return channel;
  }

  // Subscribes to a group, as the service does when it starts.
  void subscribe(IOReportService::Name group, IOReportService::Name subGroup = std::nullopt) {
    std::optional<IOReportError> error;
    auto& service = harness_.service();
    const auto found = service.IOReportCopyChannelsInGroup(group, subGroup, error);
    ASSERT_NE(found, nullptr);
    subscription_ = service.IOReportCreateSubscription(found, subscribed_, error);
    ASSERT_NE(subscribed_, nullptr);
    EXPECT_FALSE(error.has_value());
  }
  IOReportService::Samples sample() { return sample(*harness_.service().makeMoment()); }
  IOReportService::Samples sample(IOReportMoment& moment) {
    std::optional<IOReportError> error;
    return harness_.service().IOReportCreateSamples(subscription_, subscribed_, moment, error);
  }
  Texts show(const IOReportService::Samples& samples) {
    Texts lines;
    harness_.service().IOReportIterate(samples, [&lines](const IOReportChannel& channel) {
      lines.push_back(describe(channel));
      return 0;
    });
    return lines;
  }
  Texts delta(const IOReportService::Samples& previous, const IOReportService::Samples& current) {
    std::optional<IOReportError> error;
    return show(harness_.service().IOReportCreateSamplesDelta(previous, current, error));
  }
  // The delta between samples of the first and of the second list of channels.
  Texts change(ChannelList before, ChannelList after) {
    harness_.set(std::move(before));
    subscribe("Speaker");
    const auto previous = sample();
    harness_.set(std::move(after));
    return delta(previous, sample());
  }

  // A channel as text, such as "Amp<1>/Speaker/Stats/pulses 42 pulses".
  static std::string describe(const IOReportChannel& channel) {
    std::string text;
    for (const auto& part :
         {IOReportChannelGetDriverName(channel), IOReportChannelGetGroup(channel),
          IOReportChannelGetSubGroup(channel)}) {
      text += std::string(part.value_or("-")) + "/";
    }
    text += std::string(IOReportChannelGetChannelName(channel).value_or("-"));
    if (IOReportChannelGetFormat(channel) == IOReportFormat::kSimple) {
      text += " " + std::to_string(IOReportSimpleGetIntegerValue(channel));
    }
    for (std::int32_t index = 0; index < IOReportStateGetCount(channel); ++index) {
      text += " " + std::string(IOReportStateGetNameForIndex(channel, index)) + ":" +
              std::to_string(IOReportStateGetInTransitions(channel, index)) + ":" +
              std::to_string(IOReportStateGetResidency(channel, index));
    }
    for (std::int32_t index = 0; index < IOReportHistogramGetBucketCount(channel); ++index) {
      text += " " + std::to_string(IOReportHistogramGetBucketHits(channel, index));
    }
    return text + " " + std::string(IOReportChannelGetUnitLabel(channel));
  }

  Harness harness_;
  IOReportService::Subscription subscription_;
  IOReportService::Channels subscribed_;
};
TYPED_TEST_SUITE_P(IOReportContract);

using ::testing::ElementsAre;
using ::testing::IsEmpty;

// --- Channels and samples -----------------------------------------------------------------------

TYPED_TEST_P(IOReportContract, AGroupIsChosenByItsNamesAndAnAbsentNameMeansAny) {
  ChannelOfDriver both = this->counter(1);
  both.subGroup = "MCA";
  ChannelOfDriver other = this->counter(1);
  other.group = "Rx";
  other.subGroup = "MCA";
  this->harness_.set({this->counter(1), both, other});
  const auto countIn = [this](IOReportService::Name group, IOReportService::Name subGroup) {
    std::optional<IOReportError> error;
    auto& service = this->harness_.service();
    const auto found = service.IOReportCopyChannelsInGroup(group, subGroup, error);
    return found == nullptr ? 0 : service.IOReportGetChannelCount(found);
  };

  EXPECT_EQ(countIn("Speaker", std::nullopt), 2);
  EXPECT_EQ(countIn(std::nullopt, "MCA"), 2);
  EXPECT_EQ(countIn("Rx", "MCA"), 1);
  EXPECT_EQ(countIn("Tx", std::nullopt), 0);
}

TYPED_TEST_P(IOReportContract, SamplesHaveWhatEachChannelCounted) {
  ChannelOfDriver nameless;
  nameless.group = "Speaker";
  nameless.integerValue = -5;
  nameless.kind = IOReportKind::kGauge;
  this->harness_.set(
      {this->counter(7), this->states(1, 20, 30), this->histogram({4, 0, 1}), nameless});
  this->subscribe("Speaker");

  EXPECT_THAT(this->show(this->sample()),
              ElementsAre("Amp<1>/Speaker/Stats/pulses 7 pulses",
                          "Amp<1>/Speaker/Stats/pulses on:1:20 off:0:30 pulses",
                          "Amp<1>/Speaker/Stats/pulses 4 0 1 pulses", "-/Speaker/-/- -5 "));
}

TYPED_TEST_P(IOReportContract, SamplesStayAsTheyWere) {
  this->harness_.set({this->counter(7)});
  this->subscribe("Speaker");
  const auto samples = this->sample();

  this->harness_.set({this->counter(8)});

  EXPECT_THAT(this->show(samples), ElementsAre("Amp<1>/Speaker/Stats/pulses 7 pulses"));
}

// This must hold even if one session follows another at once.
TYPED_TEST_P(IOReportContract, NoReadingIsUsedThatIsOlderThanTheMoment) {
  this->harness_.set({this->counter(0)});
  this->subscribe("Speaker");

  for (int count = 1; count <= 40; ++count) {
    this->harness_.set({this->counter(count)});
    EXPECT_THAT(this->show(this->sample()),
                ElementsAre("Amp<1>/Speaker/Stats/pulses " + std::to_string(count) + " pulses"));
  }
}

TYPED_TEST_P(IOReportContract, AllSamplesOfAMomentAreOfOneReading) {
  ChannelOfDriver receiver = this->counter(1);
  receiver.group = "Rx";
  receiver.subGroup = "MCA";
  this->harness_.set({this->counter(1), receiver});
  const auto moment = this->harness_.service().makeMoment();
  this->subscribe("Speaker");
  const auto first = this->sample(*moment);

  receiver.integerValue = 9;
  this->harness_.set({this->counter(9), receiver});
  this->subscribe("Rx", "MCA");

  EXPECT_THAT(this->show(first), ElementsAre("Amp<1>/Speaker/Stats/pulses 1 pulses"));
  EXPECT_THAT(this->show(this->sample(*moment)), ElementsAre("Amp<1>/Rx/MCA/pulses 1 pulses"));
}

TYPED_TEST_P(IOReportContract, AMomentReadsWhenItIsFirstSampled) {
  this->harness_.set({this->counter(1)});
  this->subscribe("Speaker");
  const auto moment = this->harness_.service().makeMoment();

  this->harness_.set({this->counter(9)});

  EXPECT_THAT(this->show(this->sample(*moment)),
              ElementsAre("Amp<1>/Speaker/Stats/pulses 9 pulses"));
}

TYPED_TEST_P(IOReportContract, AChannelThatComesAfterTheSubscriptionIsNotSampled) {
  this->harness_.set({this->counter(7)});
  this->subscribe("Speaker");
  ChannelOfDriver later = this->counter(8);
  later.channelName = "later";
  ChannelOfDriver otherDriver = this->counter(9);
  otherDriver.driverName = "Amp<2>";

  this->harness_.set({later, this->counter(7), otherDriver});

  EXPECT_THAT(this->show(this->sample()), ElementsAre("Amp<1>/Speaker/Stats/pulses 7 pulses"));
}

TYPED_TEST_P(IOReportContract, AChannelThatGoesIsNotSampledBeforeItComesAgain) {
  this->harness_.set({this->counter(7)});
  this->subscribe("Speaker");

  this->harness_.set({});
  EXPECT_THAT(this->show(this->sample()), IsEmpty());
  this->harness_.set({this->counter(8)});

  EXPECT_THAT(this->show(this->sample()), ElementsAre("Amp<1>/Speaker/Stats/pulses 8 pulses"));
}

TYPED_TEST_P(IOReportContract, IteratingEndsWhenTheVisitorSaysSo) {
  this->harness_.set({this->counter(7), this->states(1, 1, 1)});
  this->subscribe("Speaker");
  int seen = 0;

  this->harness_.service().IOReportIterate(this->sample(),
                                           [&seen](const IOReportChannel&) { return ++seen; });

  EXPECT_EQ(seen, 1);
}

// --- Differences --------------------------------------------------------------------------------

TYPED_TEST_P(IOReportContract, ACounterIsSubtracted) {
  EXPECT_THAT(this->change({this->counter(100)}, {this->counter(142)}),
              ElementsAre("Amp<1>/Speaker/Stats/pulses 42 pulses"));
}

TYPED_TEST_P(IOReportContract, ACounterThatWasResetHasCountedSince) {
  EXPECT_THAT(this->change({this->counter(100)}, {this->counter(40)}),
              ElementsAre("Amp<1>/Speaker/Stats/pulses 40 pulses"));
}

TYPED_TEST_P(IOReportContract, AGaugeThatFellHasANegativeDifference) {
  EXPECT_THAT(this->change({this->gauge(100)}, {this->gauge(40)}),
              ElementsAre("Amp<1>/Speaker/Stats/pulses -60 pulses"));
  EXPECT_THAT(this->change({this->gauge(-40)}, {this->gauge(100)}),
              ElementsAre("Amp<1>/Speaker/Stats/pulses 140 pulses"));
}

TYPED_TEST_P(IOReportContract, TheDifferenceOfAGaugeIsAtMostWhat64BitsHold) {
  using Limits = std::numeric_limits<std::int64_t>;

  EXPECT_THAT(this->change({this->gauge(Limits::max())}, {this->gauge(Limits::min())}),
              ElementsAre("Amp<1>/Speaker/Stats/pulses -9223372036854775808 pulses"));
  EXPECT_THAT(this->change({this->gauge(Limits::min())}, {this->gauge(Limits::max())}),
              ElementsAre("Amp<1>/Speaker/Stats/pulses 9223372036854775807 pulses"));
}

TYPED_TEST_P(IOReportContract, StatesAreSubtractedAndTheirDutyCycleIsOfTheTimeBetween) {
  this->harness_.set({this->states(1, 1000, 50)});
  this->subscribe("Speaker");
  const auto previous = this->sample();
  this->harness_.set({this->states(3, 1300, 150)});
  std::optional<IOReportError> error;
  const auto changed =
      this->harness_.service().IOReportCreateSamplesDelta(previous, this->sample(), error);

  std::vector<double> dutyCycles;
  this->harness_.service().IOReportIterate(changed, [&dutyCycles](const IOReportChannel& channel) {
    dutyCycles = {IOReportStateGetDutyCycle(channel, 0), IOReportStateGetDutyCycle(channel, 1)};
    return 0;
  });

  EXPECT_THAT(this->show(changed),
              ElementsAre("Amp<1>/Speaker/Stats/pulses on:2:300 off:0:100 pulses"));
  EXPECT_THAT(dutyCycles, ElementsAre(0.75, 0.25));
}

TYPED_TEST_P(IOReportContract, StatesOfWhichOneWasResetWereAllReset) {
  EXPECT_THAT(this->change({this->states(5, 900, 800)}, {this->states(6, 1000, 30)}),
              ElementsAre("Amp<1>/Speaker/Stats/pulses on:6:1000 off:0:30 pulses"));
}

TYPED_TEST_P(IOReportContract, HitsAreSubtracted) {
  EXPECT_THAT(this->change({this->histogram({5, 1, 2})}, {this->histogram({9, 1, 3})}),
              ElementsAre("Amp<1>/Speaker/Stats/pulses 4 0 1 pulses"));
}

TYPED_TEST_P(IOReportContract, AHistogramOfWhichOneBucketWasResetWasAllReset) {
  EXPECT_THAT(this->change({this->histogram({5, 3, 0})}, {this->histogram({6, 1, 0})}),
              ElementsAre("Amp<1>/Speaker/Stats/pulses 6 1 0 pulses"));
}

TYPED_TEST_P(IOReportContract, TheExtremesOfADifferenceAreThoseOfTheBucketsThatGrew) {
  const auto extremes = [this](std::vector<std::uint64_t> before,
                               std::vector<std::uint64_t> after) {
    this->harness_.set({this->histogram(std::move(before))});
    this->subscribe("Speaker");
    const auto previous = this->sample();
    this->harness_.set({this->histogram(std::move(after))});
    std::optional<IOReportError> error;
    std::vector<std::int64_t> found;
    auto& service = this->harness_.service();
    service.IOReportIterate(
        service.IOReportCreateSamplesDelta(previous, this->sample(), error),
        [&found](const IOReportChannel& channel) {
          found = {IOReportHistogramGetMinValue(channel), IOReportHistogramGetMaxValue(channel)};
          return 0;
        });
    return found;
  };

  EXPECT_THAT(extremes({5, 1, 2}, {5, 3, 2}), ElementsAre(10, 20));
  EXPECT_THAT(extremes({5, 1, 2}, {6, 2, 2}), ElementsAre(0, 20));
  // The maximum is the upper bound of the highest bucket with new hits, or the lower bound of that
  // bucket if it is open.
  EXPECT_THAT(extremes({5, 1, 2}, {5, 2, 3}), ElementsAre(10, 20));
  EXPECT_THAT(extremes({5, 1, 2}, {5, 1, 3}), ElementsAre(20, 20));
  EXPECT_THAT(extremes({5, 1, 2}, {5, 1, 2}), ElementsAre(0, 0));
}

TYPED_TEST_P(IOReportContract, AChannelThatIsInOneSampleOnlyHasNoDifference) {
  ChannelOfDriver other = this->counter(100);
  other.channelName = "other";
  this->harness_.set({this->counter(1), other});
  this->subscribe("Speaker");
  const auto both = this->sample();
  this->harness_.set({this->counter(5)});
  const auto one = this->sample();

  EXPECT_THAT(this->delta(both, one), ElementsAre("Amp<1>/Speaker/Stats/pulses 4 pulses"));
  EXPECT_THAT(this->delta(one, both), ElementsAre("Amp<1>/Speaker/Stats/pulses 1 pulses"));
}

TYPED_TEST_P(IOReportContract, AChannelOfOtherKindFormatUnitStatesOrBucketsIsAnother) {
  ChannelOfDriver otherUnit = this->counter(142);
  otherUnit.unitLabel = "ms";
  ChannelOfDriver otherState = this->states(9, 9, 9);
  otherState.states[1].name = "standby";
  ChannelOfDriver otherBucket = this->histogram({9, 9, 9});
  otherBucket.buckets[1].upper = 19;
  otherBucket.buckets[2].lower = 19;

  EXPECT_THAT(this->change({this->counter(100)}, {otherUnit}), IsEmpty());
  EXPECT_THAT(this->change({this->counter(100)}, {this->gauge(142)}), IsEmpty());
  EXPECT_THAT(this->change({this->counter(100)}, {this->states(1, 1, 1)}), IsEmpty());
  EXPECT_THAT(this->change({this->states(1, 1, 1)}, {otherState}), IsEmpty());
  EXPECT_THAT(this->change({this->histogram({1, 1, 1})}, {otherBucket}), IsEmpty());
}

TYPED_TEST_P(IOReportContract, ChannelsAreFoundWhereverTheyStand) {
  ChannelOfDriver second = this->counter(10);
  second.channelName = "second";
  ChannelOfDriver secondLater = second;
  secondLater.integerValue = 15;

  EXPECT_THAT(
      this->change({this->counter(1), second}, {secondLater, this->counter(3)}),
      ElementsAre("Amp<1>/Speaker/Stats/second 5 pulses", "Amp<1>/Speaker/Stats/pulses 2 pulses"));
}

TYPED_TEST_P(IOReportContract, ThereIsNoDifferenceFromNothing) {
  this->harness_.set({this->counter(7)});
  this->subscribe("Speaker");
  std::optional<IOReportError> error;

  EXPECT_EQ(this->harness_.service().IOReportCreateSamplesDelta(nullptr, this->sample(), error),
            nullptr);
  EXPECT_FALSE(error.has_value());
}

REGISTER_TYPED_TEST_SUITE_P(
    IOReportContract, AGroupIsChosenByItsNamesAndAnAbsentNameMeansAny,
    SamplesHaveWhatEachChannelCounted, SamplesStayAsTheyWere,
    NoReadingIsUsedThatIsOlderThanTheMoment, AllSamplesOfAMomentAreOfOneReading,
    AMomentReadsWhenItIsFirstSampled, AChannelThatComesAfterTheSubscriptionIsNotSampled,
    AChannelThatGoesIsNotSampledBeforeItComesAgain, IteratingEndsWhenTheVisitorSaysSo,
    ACounterIsSubtracted, ACounterThatWasResetHasCountedSince, AGaugeThatFellHasANegativeDifference,
    TheDifferenceOfAGaugeIsAtMostWhat64BitsHold,
    StatesAreSubtractedAndTheirDutyCycleIsOfTheTimeBetween, StatesOfWhichOneWasResetWereAllReset,
    HitsAreSubtracted, AHistogramOfWhichOneBucketWasResetWasAllReset,
    TheExtremesOfADifferenceAreThoseOfTheBucketsThatGrew,
    AChannelThatIsInOneSampleOnlyHasNoDifference,
    AChannelOfOtherKindFormatUnitStatesOrBucketsIsAnother, ChannelsAreFoundWhereverTheyStand,
    ThereIsNoDifferenceFromNothing);

}  // namespace halvox::platform::contract
