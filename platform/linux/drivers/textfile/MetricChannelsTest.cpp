#include "platform/linux/drivers/textfile/MetricChannels.h"

#include <ctime>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/drivers/testing/MadeReadings.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

std::vector<std::string> channelsOf(std::string_view text) {
  auto made = MetricChannels::from(text);
  if (const auto* error = std::get_if<MetricError>(&made)) {
    return {"line " + std::to_string(error->line) + ": " + error->what};
  }
  std::vector<ChannelList::Channel> channels;
  std::vector<std::uint64_t> values;
  for (auto& channel : std::get<std::vector<MetricChannel>>(made)) {
    channels.push_back(std::make_shared<const ChannelDescription>(channel.description));
    values.insert(values.end(), channel.values.begin(), channel.values.end());
  }
  return testing::describe(testing::samplesOf(testing::makeReading(channels, values)));
}

TEST(MetricChannelsTest, CountersAndGaugesAreSimpleChannels) {
  EXPECT_THAT(
      channelsOf("# TYPE pulses counter\n"
                 "# UNIT pulses beats\n"
                 "pulses_total{driver=\"D\",group=\"Haptics\",subgroup=\"Stats\"} 17\n"
                 "# TYPE level gauge\n"
                 "level{group=\"Haptics\",channel=\"Peak Level\",unit=\"dB\"} -3.5 1700000000\n"
                 "# EOF\n"),
      ElementsAre("D/Haptics/Stats/pulses beats = 17", "-/Haptics/-/Peak Level dB = -4"));
}

TEST(MetricChannelsTest, ACounterIsOneAndAGaugeIsNot) {
  const auto made = MetricChannels::from("# TYPE a counter\na_total 1\n# TYPE b gauge\nb 1\n");

  const auto& channels = std::get<std::vector<MetricChannel>>(made);
  ASSERT_EQ(channels.size(), 2U);
  EXPECT_EQ(channels[0].description.kind, IOReportKind::kCounter);
  EXPECT_EQ(channels[1].description.kind, IOReportKind::kGauge);
}

TEST(MetricChannelsTest, TheFormWithoutAnEndIsReadToo) {
  EXPECT_THAT(channelsOf("# HELP pulses_total All pulses.\n"
                         "# TYPE pulses_total counter\n"
                         "\n"
                         "# a remark\n"
                         "pulses_total 9223372036854775807\n"),
              ElementsAre("-/-/-/pulses_total  = 9223372036854775807"));
}

TEST(MetricChannelsTest, CumulativeBucketsAreTakenApart) {
  EXPECT_THAT(channelsOf("# TYPE wait histogram\n"
                         "wait_bucket{group=\"Speaker\",unit=\"us\",le=\"10\"} 0\n"
                         "wait_bucket{group=\"Speaker\",unit=\"us\",le=\"20.0\"} 4\n"
                         "wait_bucket{group=\"Speaker\",unit=\"us\",le=\"30\"} 4\n"
                         "wait_bucket{group=\"Speaker\",unit=\"us\",le=\"+Inf\"} 5\n"
                         "wait_count{group=\"Speaker\",unit=\"us\"} 5\n"
                         "wait_sum{group=\"Speaker\",unit=\"us\"} 91.5\n"),
              ElementsAre("-/Speaker/-/wait us = 0-10:0 10-20:4 20-30:0 30-9223372036854775807:1 "
                          "min 10 max 30"));
}

TEST(MetricChannelsTest, AStateSetWithItsCountersIsAStateChannel) {
  EXPECT_THAT(channelsOf("# TYPE amp stateset\n"
                         "amp{group=\"TarnoQ7AMP\",amp=\"on\"} 1\n"
                         "amp{group=\"TarnoQ7AMP\",amp=\"off\"} 0\n"
                         "# TYPE amp_residency counter\n"
                         "# UNIT amp_residency ms\n"
                         "amp_residency_total{group=\"TarnoQ7AMP\",amp=\"on\"} 900\n"
                         "amp_residency_total{group=\"TarnoQ7AMP\",amp=\"off\"} 100\n"
                         "# TYPE amp_transitions counter\n"
                         "amp_transitions_total{group=\"TarnoQ7AMP\",amp=\"on\"} 3\n"
                         "amp_transitions_total{group=\"TarnoQ7AMP\",amp=\"off\"} 2\n"
                         "# EOF\n"),
              ElementsAre("-/TarnoQ7AMP/-/amp ms = on:3:900 off:2:100"));
}

TEST(MetricChannelsTest, MetricsThatAreNotChannelsAreSkipped) {
  EXPECT_THAT(channelsOf("untold 3\n"
                         "# TYPE rpc summary\nrpc{quantile=\"0.5\"} 3\nrpc_sum 3\n"
                         "# TYPE mode stateset\nmode{mode=\"a\"} 1\n"
                         "# TYPE absent gauge\nabsent NaN\n"
                         "# TYPE build info\nbuild_info{version=\"1\"} 1\n"),
              IsEmpty());
}

TEST(MetricChannelsTest, EscapesInLabelsAreResolvedAndOtherLabelsNameTheChannel) {
  EXPECT_THAT(channelsOf("# TYPE a gauge\n"
                         R"(a { driver = "x\\\"y", port="left", } 1)"
                         "\n"),
              ElementsAre("x\\\"y/-/-/a port=left  = 1"));
}

TEST(MetricChannelsTest, AnExemplarIsPassedOver) {
  EXPECT_THAT(channelsOf("# TYPE a counter\na_total 1 # {trace=\"}\"} 0.5 1700000000.5\n# EOF"),
              ElementsAre("-/-/-/a  = 1"));
}

struct WrongText {
  const char* name;
  std::string text;
  const char* error;
};

class WrongMetricsTest : public ::testing::TestWithParam<WrongText> {};

TEST_P(WrongMetricsTest, IsRefusedWithItsLine) {
  EXPECT_THAT(channelsOf(GetParam().text), ElementsAre(GetParam().error));
}

INSTANTIATE_TEST_SUITE_P(
    All, WrongMetricsTest,
    ::testing::Values(
        WrongText{"HalfWritten", "# TYPE a gauge\na 1\na{x=\"",
                  "line 3: expected the end of a text in quotes"},
        WrongText{"CutInANumber", "# TYPE a gauge\na 12",
                  "line 2: the last line has no line break: the file is incomplete"},
        WrongText{"BehindTheEnd", "# EOF\na 1\n", "line 2: expected nothing after # EOF"},
        WrongText{"NotUtf8", "# TYPE a gauge\na{b=\"\xff\"} 1\n",
                  "line 2: the line is not valid UTF-8"},
        WrongText{"LongLine", "# " + std::string(9000, 'x') + "\n",
                  "line 1: expected a line of at most 8192 bytes"},
        WrongText{"Twice", "# TYPE a gauge\na{x=\"1\",y=\"2\"} 1\na{y=\"2\",x=\"1\"} 1\n",
                  "line 3: this value appears twice"},
        WrongText{"TwoTypes", "# TYPE a gauge\n# TYPE a counter\n",
                  "line 2: the type of a is declared twice"},
        WrongText{"LateType", "a 1\n# TYPE a gauge\n",
                  "line 2: the type of a is declared after its values"},
        WrongText{"UnknownType", "# TYPE a number\n", "line 1: expected a type of metric"},
        WrongText{"OtherUnit", "# UNIT a ms\n# UNIT a us\n",
                  "line 2: the unit of a is declared twice with different values"},
        WrongText{"LabelTwice", "a{x=\"1\",x=\"2\"} 1\n", "line 1: the label x appears twice"},
        WrongText{"WrongEscape", "a{x=\"\\t\"} 1\n",
                  "line 1: expected \\n, \\\\ or \\\" as the only escapes"},
        WrongText{"NoNumber", "a one\n", "line 1: expected a number"},
        WrongText{"NegativeCounter", "# TYPE a counter\na_total -1\n",
                  "line 2: expected a count, from 0 to 9223372036854775807"},
        WrongText{"NanCounter", "# TYPE a counter\na_total NaN\n",
                  "line 2: expected a count, from 0 to 9223372036854775807"},
        WrongText{"HugeCounter", "# TYPE a counter\na_total 9223372036854775808\n",
                  "line 2: expected a count, from 0 to 9223372036854775807"},
        WrongText{"NotCumulative",
                  "# TYPE a histogram\na_bucket{le=\"1\"} 5\na_bucket{le=\"+Inf\"} 4\n",
                  "line 3: expected at least the hits of the previous bucket"},
        WrongText{"BoundsBackwards",
                  "# TYPE a histogram\na_bucket{le=\"2\"} 1\na_bucket{le=\"1\"} 1\n",
                  "line 3: expected a greater bound than that of the previous bucket"},
        WrongText{"NoInfiniteBucket", "# TYPE a histogram\na_bucket{le=\"1\"} 5\na_count 5\n",
                  "line 2: expected a bucket with le=\"+Inf\""},
        WrongText{"OtherCount", "# TYPE a histogram\na_bucket{le=\"+Inf\"} 5\na_count 4\n",
                  "line 3: expected the same count as the bucket with le=\"+Inf\""},
        WrongText{"FractionBound", "# TYPE a histogram\na_bucket{le=\"0.5\"} 5\n",
                  "line 2: expected a whole number or +Inf as the bucket's bound"},
        WrongText{"BareHistogram", "# TYPE a histogram\na 5\n",
                  "line 2: the name a does not suit the type of a"},
        WrongText{"StateWithoutResidency",
                  "# TYPE a stateset\na{a=\"x\"} 1\n# TYPE a_transitions counter\n"
                  "a_transitions_total{a=\"x\"} 1\n",
                  "line 2: expected a counter a_residency"},
        WrongText{"SameChannel",
                  "# TYPE a gauge\na{channel=\"x\"} 1\n# TYPE b gauge\nb{channel=\"x\"} 1\n",
                  "line 4: this channel is already in line 2"}),
    [](const auto& one) { return one.param.name; });

// A text with that number of values for each of three metrics. The first two have the given type.
std::string threeMetrics(const std::string& type, const std::string& counters) {
  constexpr int kChannels = 5'800;
  std::string states = "# TYPE m " + type + "\n";
  std::string residency = "# TYPE m_residency " + counters + "\n";
  std::string transitions = "# TYPE m_transitions " + counters + "\n";
  const std::string suffix = counters == "counter" ? "_total" : "";
  for (int channel = 0; channel < kChannels; ++channel) {
    const std::string labels = "{channel=\"" + std::to_string(channel) + "\",m=\"on\"} 1\n";
    states.append("m").append(labels);
    residency.append("m_residency").append(suffix).append(labels);
    transitions.append("m_transitions").append(suffix).append(labels);
  }
  return states + residency + transitions;
}

// The CPU time of this thread, which other work on the machine does not change.
double secondsToRead(const std::string& text) {
  const auto now = [] {
    timespec time{};
    ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
    return static_cast<double>(time.tv_sec) + 1e-9 * static_cast<double>(time.tv_nsec);
  };
  const double begin = now();
  const auto made = OpenMetricsText::parse(text);
  static_cast<void>(MetricChannels::from(text));
  return std::holds_alternative<MetricError>(made) ? 0 : now() - begin;
}

TEST(MetricChannelsTest, StatesAreFoundAmongManyWithoutLookingAtAll) {
  // The time for the same number of values of a type that makes no channels.
  const double plain = secondsToRead(threeMetrics("info", "unknown"));
  const double states = secondsToRead(threeMetrics("stateset", "counter"));

  EXPECT_GT(plain, 0);
  // Searching all counters for each state took ten times as long.
  EXPECT_LT(states, 5 * plain);
}

TEST(OpenMetricsTextTest, SizesAreBounded) {
  std::string labels;
  for (int label = 0; label < 40; ++label) labels += "l" + std::to_string(label) + "=\"\",";
  std::string samples;
  for (int sample = 0; sample <= 20'000; ++sample) samples += "a" + std::to_string(sample) + " 1\n";

  EXPECT_THAT(channelsOf("a{" + labels + "} 1\n"),
              ElementsAre("line 1: expected at most 32 labels"));
  EXPECT_THAT(channelsOf(samples), ElementsAre("line 20001: expected at most 20000 values"));
  EXPECT_THAT(channelsOf(std::string((1U << 20U) + 1, '\n')),
              ElementsAre("line 1: expected at most 1048576 bytes"));
}

}  // namespace
}  // namespace halvox::platform::linux_
