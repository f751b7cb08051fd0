#include "tools/export/PerfettoTrace.h"

#include <array>
#include <limits>
#include <string>

#include <gtest/gtest.h>
#include <protozero/pbf_reader.hpp>

namespace halvox::tools {
namespace {

using Annotation = PerfettoTrace::Annotation;
using Time = PerfettoTrace::Time;
using TrackKind = PerfettoTrace::TrackKind;

// A message as text, by the numbers of its fields: "1{10:1 8:5}". Texts are quoted. What is length
// delimited is a message if its number is in `messages`.
std::string shown(protozero::pbf_reader reader, const std::string& messages) {
  std::string text;
  while (reader.next()) {
    const std::string number = std::to_string(reader.tag());
    text += (text.empty() ? "" : " ") + number;
    switch (reader.wire_type()) {
      case protozero::pbf_wire_type::varint:
        text += ":" + std::to_string(reader.get_uint64());
        break;
      case protozero::pbf_wire_type::fixed64:
        text += ":" + std::to_string(reader.get_double());
        break;
      default: {
        const auto view = reader.get_view();
        const bool isMessage = messages.find("[" + number + "]") != std::string::npos;
        text += isMessage ? "{" + shown(protozero::pbf_reader(view), messages) + "}"
                          : "\"" + std::string(view.data(), view.size()) + "\"";
      }
    }
  }
  return text;
}

// The packet that is written, without what all have. Its messages have the numbers `messages`.
template <typename Write>
std::string packetOf(const std::string& messages, Write write) {
  std::string text;
  PerfettoTrace trace(text);
  write(trace);
  protozero::pbf_reader reader(text);
  EXPECT_TRUE(reader.next(1));
  const std::string all = shown(reader.get_message(), messages);
  EXPECT_FALSE(reader.next());
  constexpr std::string_view kBegin = "10:1 ";
  EXPECT_TRUE(all.starts_with(kBegin)) << all;
  return all.substr(kBegin.size());
}

constexpr PerfettoTrace::TrackID kTrack{7};
constexpr PerfettoTrace::TrackID kParent{6};

TEST(PerfettoTraceTest, TheClockIsRealTime) {
  EXPECT_EQ(packetOf("[6]", [](PerfettoTrace& trace) { trace.begin(Time(5)); }),
            "13:1 6{1\"\b\x01\x10\x05\" 2:1}");
}

TEST(PerfettoTraceTest, TracksHaveTheirParentAndName) {
  EXPECT_EQ(
      packetOf("[60][3]", [](PerfettoTrace& trace) { trace.describeProcess(kTrack, 3, "p"); }),
      "60{1:7 3{1:3 6\"p\"}}");
  EXPECT_EQ(
      packetOf("[60]", [](PerfettoTrace& trace) { trace.describeTrack(kTrack, kParent, "t"); }),
      "60{1:7 5:6 2\"t\"}");
  EXPECT_EQ(
      packetOf("[60][8]",
               [](PerfettoTrace& trace) { trace.describeCounter(kTrack, kParent, "c", "u"); }),
      "60{1:7 5:6 2\"c\" 8{6\"u\"}}");
}

TEST(PerfettoTraceTest, EventsHaveTheirTimeAndAnnotations) {
  const std::array<Annotation, 3> notes{Annotation{"i", std::int64_t{4}}, Annotation{"d", 0.5},
                                        Annotation{"s", std::string_view("x\xFF")}};
  const auto event = [&](auto member) {
    return packetOf("[11][4]", [&](PerfettoTrace& trace) {
      (trace.*member)(
          {.track = kTrack, .time = Time(9), .name = "n", .category = "k", .annotations = notes});
    });
  };
  const std::string rest =
      " 11:7 22\"k\" 23\"n\" 4{10\"i\" 4:4} 4{10\"d\" 5:0.500000} 4{10\"s\" 6\"x\uFFFD\"}}";
  // In an annotation, 4 is a number, and in an event it is the annotation.
  EXPECT_EQ(event(&PerfettoTrace::beginSlice), "8:9 58:1 11{9:1" + rest);
  EXPECT_EQ(event(&PerfettoTrace::endSlice), "8:9 58:1 11{9:2" + rest);
  EXPECT_EQ(event(&PerfettoTrace::addInstant), "8:9 58:1 11{9:3" + rest);
}

TEST(PerfettoTraceTest, CountersHaveAValue) {
  EXPECT_EQ(packetOf("[11]", [](PerfettoTrace& trace) { trace.setCounter(kTrack, Time(9), 0.25); }),
            "8:9 58:1 11{9:4 11:7 44:0.250000}");
}

TEST(PerfettoTraceTest, TimesAreExactAndWithinBounds) {
  EXPECT_EQ(PerfettoTrace::timeOf(1'700'000'000.5).count(), 1'700'000'000'500'000'000);
  EXPECT_EQ(PerfettoTrace::timeOf(-1).count(), 0);
  EXPECT_EQ(PerfettoTrace::timeOf(std::numeric_limits<double>::quiet_NaN()).count(), 0);
  EXPECT_EQ(PerfettoTrace::timeOf(1e300).count(), 9'200'000'000'000'000'000);
}

TEST(PerfettoTraceTest, TracksOfTwoKindsOrNumbersDiffer) {
  const auto track = PerfettoTrace::track;
  EXPECT_NE(track(TrackKind::kStream, 1), track(TrackKind::kVolume, 1));
  EXPECT_NE(track(TrackKind::kStream, 1), track(TrackKind::kStream, 2));
  EXPECT_NE(track(TrackKind::kStream, -1), track(TrackKind::kProcess, -1));
}

}  // namespace
}  // namespace halvox::tools
