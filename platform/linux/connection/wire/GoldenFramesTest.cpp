#include "platform/linux/connection/wire/testdata/GoldenFrames.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <map>

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/ValueDecoder.h"
#include "platform/linux/connection/wire/testdata/TestFrames.h"

namespace halvox::platform::linux_::dbus {
namespace {

using Values = std::vector<Value>;

template <typename Number>
Values bothEnds() {
  return {std::numeric_limits<Number>::min(), std::numeric_limits<Number>::max()};
}

Data dataOf(std::string_view bytes) { return Data(asBytes(bytes)); }

Dictionary tenFields() {
  return {{"session_identifier", "spotify-4711"},
          {"HostApplicationDisplayID", "com.example.music.player"},
          {"sample_rate", 48000.0},
          {"channel_count", 2U},
          {"io_buffer_size", 512},
          {"active_devices", Array{"speaker", "headphones"}},
          {"is_playing", true},
          {"start_time", std::int64_t{1700000000123}},
          {"glitch_count", std::uint64_t{3}},
          {"volume", 0.75}};
}

Array oneToFiveCounted() {
  return {Array{std::int64_t{1}}, Array{}, Array{std::int64_t{2}, std::int64_t{3}}};
}

// Returns the expected values of the cases without containers.
std::map<std::string_view, Values> expectedBasics() {
  const double infinity = std::numeric_limits<double>::infinity();
  return {
      {"no_arguments", {}},
      {"bytes", bothEnds<std::uint8_t>()},
      {"int16", bothEnds<std::int16_t>()},
      {"uint16", bothEnds<std::uint16_t>()},
      {"int32", bothEnds<std::int32_t>()},
      {"uint32", bothEnds<std::uint32_t>()},
      {"int64", bothEnds<std::int64_t>()},
      {"uint64", bothEnds<std::uint64_t>()},
      {"doubles", {1.5, std::nan(""), infinity, -infinity}},
      {"booleans", {false, true}},
      {"strings", {"", "plain text of more than 14 bytes", "grüß € \U0001f600"}},
      {"paths", {"/", "/a/b_1"}},
      {"signatures", {"", "a{sv}uqaax"}},
      {"data", {dataOf(""), dataOf({"\x01\x00\xff", 3})}},
      {"dates", {std::uint8_t{7}, Date{1700000000.25}}},
      {"date_in_variant", {Date{-1.5}}},
      {"many_alignments", {1, 2, 3, 4, 5, 6, 7, 8.5, 9, true, 11, "s", 13, "g", 15, 16, 17, 18}},
      {"bus_call", {}},
      {"reply", {true}},
      {"error", {"no such session"}},
      {"signal", {}},
  };
}

std::map<std::string_view, Values> expectedContainers() {
  return {
      {"arrays", {Array{std::int64_t{1}, std::int64_t{-2}}, Array{"a", "bc"}}},
      {"empty_arrays", {Array{}, Array{}, Array{}, Dictionary{}}},
      {"nested_arrays", {oneToFiveCounted()}},
      {"array_of_variants", {Array{1, "two", true, Array{}}}},
      {"array_of_dates", {Array{Date{1}, Date{2}}}},
      {"array_of_data", {Array{dataOf("\x01"), dataOf(""), dataOf("\x02\x03")}}},
      {"dictionary", {Dictionary{{"one", 1}, {"two", "zwei"}}}},
      {"dictionary_of_integers", {Dictionary{{"a", 1}, {"b", -1}}}},
      {"dictionary_of_bytes", {Dictionary{{"a", 1}, {"bcd", 2}}}},
      {"dictionary_of_arrays", {Dictionary{{"a", Array{"x"}}, {"b", Array{}}}}},
      {"nested_dictionaries", {Dictionary{{"outer", Dictionary{{"inner", 7}}}}}},
      {"array_of_dictionaries", {Array{Dictionary{{"a", 1.0}}, Dictionary{}}}},
      {"variants_in_variants", {std::int64_t{5}}},
      {"send_message",
       {tenFields(), 14U, std::uint16_t{18}, Array{Value(Array{std::int64_t{4711}})}}},
      {"send_message_without_ids", {Dictionary{}, 1U, std::uint16_t{2}, Array{}}},
  };
}

bool sameKinds(const Value& left, const Value& right) {
  return !left.isNumber() || left.numberKind() == right.numberKind();
}

Frame frameIn(const std::string& bytes) {
  const auto result = readFrame(asBytes(bytes));
  const auto* frame = std::get_if<Frame>(&result);
  if (frame == nullptr) {
    ADD_FAILURE() << std::get<WireError>(result).message;
    return {};
  }
  return *frame;
}

const GoldenFrame& golden(std::string_view name, bool bigEndian = false) {
  return *std::ranges::find_if(kGoldenFrames, [&](const GoldenFrame& frame) {
    return frame.name == name && frame.bigEndian == bigEndian;
  });
}

TEST(GoldenFramesTest, EveryFrameDecodesToItsValuesInBothByteOrders) {
  auto expected = expectedBasics();
  expected.merge(expectedContainers());
  Values arguments;
  for (const GoldenFrame& frame : kGoldenFrames) {
    SCOPED_TRACE(std::string(frame.name) + (frame.bigEndian ? ", big endian" : ""));
    const std::string bytes = fromHex(frame.hex);
    const Frame read = frameIn(bytes);

    const auto error = decodeBody(read, read.header.signature, arguments);

    EXPECT_FALSE(error.has_value()) << error->message;
    ASSERT_TRUE(expected.contains(frame.name));
    EXPECT_EQ(arguments, expected[frame.name]);
    EXPECT_EQ(read.header.bigEndian, frame.bigEndian);
    EXPECT_EQ(read.header.serial, 1234U);
  }
}

TEST(GoldenFramesTest, NumbersKeepTheKindThatTheyHadOnTheWire) {
  const auto expected = expectedBasics();
  for (const std::string_view name :
       {"bytes", "int16", "uint16", "int32", "uint32", "int64", "uint64", "doubles", "booleans"}) {
    SCOPED_TRACE(name);
    const std::string bytes = fromHex(golden(name).hex);
    const Frame read = frameIn(bytes);
    Values arguments;

    ASSERT_FALSE(decodeBody(read, read.header.signature, arguments).has_value());

    EXPECT_TRUE(std::ranges::equal(arguments, expected.at(name), sameKinds));
  }
}

TEST(GoldenFramesTest, HeaderOfABusCallIsReadInFull) {
  for (const bool bigEndian : {false, true}) {
    const std::string bytes = fromHex(golden("bus_call", bigEndian).hex);

    const MessageHeader header = frameIn(bytes).header;

    EXPECT_EQ(header.type, MessageType::kMethodCall);
    EXPECT_EQ(header.flags, kNoReplyExpected);
    EXPECT_EQ(header.path, "/com/tarno/halvox/reporting");
    EXPECT_EQ(header.interface, "com.tarno.halvox.HVReportingServiceProtocol");
    EXPECT_EQ(header.member, "bus_call");
    EXPECT_EQ(header.destination, ":1.7");
    EXPECT_EQ(header.sender, ":1.42");
    EXPECT_EQ(header.signature, "");
    EXPECT_EQ(header.replySerial, 0U);
  }
}

TEST(GoldenFramesTest, HeadersOfRepliesErrorsAndSignalsAreRead) {
  const std::string reply = fromHex(golden("reply").hex);
  const std::string error = fromHex(golden("error").hex);
  const std::string signal = fromHex(golden("signal").hex);

  EXPECT_EQ(frameIn(reply).header.type, MessageType::kMethodReturn);
  EXPECT_EQ(frameIn(reply).header.replySerial, 1234U);
  EXPECT_EQ(frameIn(reply).header.destination, ":1.42");
  EXPECT_EQ(frameIn(error).header.type, MessageType::kError);
  EXPECT_EQ(frameIn(error).header.errorName, "com.tarno.audio.reporting.Code1");
  EXPECT_EQ(frameIn(signal).header.type, MessageType::kSignal);
  EXPECT_EQ(frameIn(signal).header.interface, "org.freedesktop.DBus");
}

TEST(GoldenFramesTest, EveryFrameIsMeasuredFromItsFirstSixteenBytes) {
  for (const GoldenFrame& frame : kGoldenFrames) {
    SCOPED_TRACE(frame.name);
    const std::string bytes = fromHex(frame.hex);
    for (std::size_t length = 0; length <= bytes.size(); ++length) {
      const auto measure = measureFrame(asBytes(bytes).first(length), bytes.size());

      if (length < kFrameStartBytes) {
        EXPECT_EQ(measure.state, FrameMeasure::State::kNeedMoreBytes);
      } else {
        EXPECT_EQ(measure.state, FrameMeasure::State::kKnown);
        EXPECT_EQ(measure.totalBytes, bytes.size());
      }
    }
  }
}

TEST(GoldenFramesTest, FrameCutAnywhereIsAnError) {
  for (const GoldenFrame& frame : kGoldenFrames) {
    const std::string bytes = fromHex(frame.hex);
    for (std::size_t length = 0; length < bytes.size(); ++length) {
      // Make a copy of exactly these bytes. AddressSanitizer then detects reads past their end.
      const std::vector<char> cut(bytes.begin(),
                                  bytes.begin() + static_cast<std::ptrdiff_t>(length));
      const auto result = readFrame(std::as_bytes(std::span(cut)));

      EXPECT_TRUE(std::holds_alternative<WireError>(result)) << frame.name << " at " << length;
    }
  }
}

TEST(GoldenFramesTest, BodyCutAnywhereIsMalformed) {
  Values arguments;
  for (const GoldenFrame& frame : kGoldenFrames) {
    const std::string bytes = fromHex(frame.hex);
    const Frame whole = frameIn(bytes);
    for (std::size_t length = 0; length < whole.body.size(); ++length) {
      const std::vector<std::byte> cut(whole.body.begin(),
                                       whole.body.begin() + static_cast<std::ptrdiff_t>(length));
      const auto error = decodeBody({whole.header, cut}, whole.header.signature, arguments);

      ASSERT_TRUE(error.has_value()) << frame.name << " at " << length;
      EXPECT_EQ(error->kind, DecodeError::Kind::kMalformed);
      EXPECT_TRUE(arguments.empty());
    }
  }
}

// Expects only that nothing reads or writes out of bounds, and that accepted values can be read.
TEST(GoldenFramesTest, FramesWithAnyBitFlippedAreReadOrRefused) {
  Values arguments;
  std::size_t taken = 0;
  for (const GoldenFrame& frame : kGoldenFrames) {
    const std::string bytes = fromHex(frame.hex);
    for (std::size_t bit = 0; bit < 8 * bytes.size(); ++bit) {
      std::string flipped = bytes;
      flipped[bit / 8] = static_cast<char>(flipped[bit / 8] ^ (1 << (bit % 8)));
      const auto result = readFrame(asBytes(flipped));
      const auto* read = std::get_if<Frame>(&result);
      if (read == nullptr) continue;
      if (decodeBody(*read, read->header.signature, arguments).has_value()) continue;
      for (const Value& argument : arguments)
        EXPECT_FALSE(describe(argument).empty() && argument.kind() == ValueKind::kNone);
      ++taken;
    }
  }
  EXPECT_GT(taken, 0U);
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus
