#include "platform/linux/connection/wire/FrameWriter.h"

#include <cmath>
#include <limits>

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/ValueDecoder.h"
#include "platform/linux/connection/wire/testdata/TestFrames.h"

namespace halvox::platform::linux_::dbus {
namespace {

using Values = std::vector<Value>;

const ReplyTo kPeer{7, {}};
const CallTarget kTarget{"org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
                         "AddMatch"};

// The bytes of a written frame, and the frame that was read from them.
struct Written {
  std::string bytes;
  Frame frame;
  Values arguments;
};

void readBack(Written& written) {
  const auto result = readFrame(asBytes(written.bytes));
  ASSERT_TRUE(std::holds_alternative<Frame>(result)) << std::get<WireError>(result).message;
  written.frame = std::get<Frame>(result);
  const auto error = decodeBody(written.frame, written.frame.header.signature, written.arguments);
  EXPECT_FALSE(error.has_value()) << error->message;
}

Written writtenReply(std::string_view signature, const Value& value) {
  Written written;
  EXPECT_TRUE(appendMethodReturn(written.bytes, kPeer, 1, signature, value)) << signature;
  readBack(written);
  return written;
}

Value roundTrip(std::string_view signature, const Value& value) {
  const Written written = writtenReply(signature, value);
  return written.arguments.empty() ? Value() : written.arguments.front();
}

bool hasForm(std::string_view signature, const Value& value) {
  std::string out = "before";
  const bool written = appendMethodReturn(out, kPeer, 1, signature, value);
  EXPECT_EQ(out == "before", !written);
  return written;
}

TEST(FrameWriterTest, PlainReplyHasReplySerialAndNoBody) {
  const Written written = writtenReply("", Value());

  EXPECT_EQ(written.frame.header.type, MessageType::kMethodReturn);
  EXPECT_EQ(written.frame.header.flags, kNoReplyExpected);
  EXPECT_EQ(written.frame.header.replySerial, 7U);
  EXPECT_EQ(written.frame.header.serial, 1U);
  EXPECT_TRUE(written.frame.body.empty());
}

TEST(FrameWriterTest, BooleanReplyHasItsValue) {
  EXPECT_EQ(writtenReply("b", true).arguments, Values{true});
  EXPECT_EQ(writtenReply("b", false).arguments, Values{false});
  EXPECT_EQ(writtenReply("b", 5).arguments, Values{true});
}

TEST(FrameWriterTest, ReplyOverABusNamesItsDestination) {
  std::string bytes;

  ASSERT_TRUE(appendMethodReturn(bytes, {0x01020304, ":1.42"}, 0x0a0b0c0d, "b", true));

  Written written{bytes, {}, {}};
  readBack(written);
  EXPECT_EQ(written.frame.header.destination, ":1.42");
  EXPECT_EQ(written.frame.header.serial, 0x0a0b0c0dU);
  EXPECT_EQ(written.frame.header.replySerial, 0x01020304U);
  EXPECT_EQ(written.arguments, Values{true});
}

TEST(FrameWriterTest, ShortFormsOfFrequentRepliesAreTheGeneralOnes) {
  // A frame for a client on a bus is built field by field, other frames are copied from a constant.
  // Both must be equal except for the destination.
  const auto withoutDestination = [](std::string_view signature, const WireBytes& body) {
    WireBytes fields;
    fields.u8(5).signature("u").u32(7);
    if (!signature.empty()) fields.align(8).u8(8).signature("g").signature(signature);
    std::string frame = frameOf(2, fields, body.bytes(), 300);
    frame[2] = kNoReplyExpected;
    return frame;
  };
  std::string plain;
  std::string boolean;

  ASSERT_TRUE(appendMethodReturn(plain, kPeer, 300, "", Value()));
  ASSERT_TRUE(appendMethodReturn(boolean, kPeer, 300, "b", true));

  EXPECT_EQ(plain, withoutDestination("", WireBytes()));
  EXPECT_EQ(boolean, withoutDestination("b", WireBytes().u32(1)));
}

TEST(FrameWriterTest, FramesAreAppendedWhateverTheLengthBefore) {
  for (std::size_t before = 0; before < 9; ++before) {
    std::string out(before, 'x');
    ASSERT_TRUE(appendMethodReturn(out, kPeer, 1, "a{sv}", Dictionary{{"a", 1.5}}));

    Written written{out.substr(before), {}, {}};
    readBack(written);
    EXPECT_EQ(written.arguments, (Values{Dictionary{{"a", 1.5}}}));
  }
}

TEST(FrameWriterTest, ErrorHasNameAndText) {
  Written written;

  ASSERT_TRUE(appendError(written.bytes, {9, ":1.1"}, 3, "com.tarno.Failed", "it went wrong"));

  readBack(written);
  EXPECT_EQ(written.frame.header.type, MessageType::kError);
  EXPECT_EQ(written.frame.header.errorName, "com.tarno.Failed");
  EXPECT_EQ(written.frame.header.replySerial, 9U);
  EXPECT_EQ(written.arguments, Values{"it went wrong"});
}

TEST(FrameWriterTest, CallHasItsTargetAndArguments) {
  Written written;
  const Values arguments{"type='signal'", 4U};

  ASSERT_TRUE(appendMethodCall(written.bytes, 5, kTarget, "su", arguments));

  readBack(written);
  EXPECT_EQ(written.frame.header.type, MessageType::kMethodCall);
  EXPECT_EQ(written.frame.header.flags, 0);
  EXPECT_EQ(written.frame.header.destination, kTarget.destination);
  EXPECT_EQ(written.frame.header.path, kTarget.path);
  EXPECT_EQ(written.frame.header.interface, kTarget.interface);
  EXPECT_EQ(written.frame.header.member, kTarget.member);
  EXPECT_EQ(written.arguments, arguments);
}

TEST(FrameWriterTest, NumberOfArgumentsMustBeThatOfTypes) {
  const Values one{1};
  std::string out;

  EXPECT_FALSE(appendMethodCall(out, 5, kTarget, "", one));
  EXPECT_FALSE(appendMethodCall(out, 5, kTarget, "uu", one));
  EXPECT_EQ(out, "");
}

TEST(FrameWriterTest, NamesAndSerialsThatAreNotValidHaveNoForm) {
  std::string out;

  EXPECT_FALSE(appendMethodReturn(out, {0, {}}, 1, "", Value()));
  EXPECT_FALSE(appendMethodReturn(out, kPeer, 0, "", Value()));
  EXPECT_FALSE(appendMethodReturn(out, {1, "x"}, 1, "", Value()));
  EXPECT_FALSE(appendError(out, kPeer, 1, "nodot", "text"));
  EXPECT_FALSE(appendError(out, kPeer, 1, "a.b", "\xff"));
  EXPECT_FALSE(appendMethodCall(out, 1, {"", "x", "", "m"}, "", {}));
  EXPECT_FALSE(appendMethodCall(out, 1, {"", "/x", "", "m.n"}, "", {}));
  EXPECT_EQ(out, "");
}

TEST(FrameWriterTest, ValuesComeBackAsTheyWere) {
  const Data data(asBytes({"\x00\xff", 2}));
  EXPECT_EQ(roundTrip("s", "grüß"), Value("grüß"));
  EXPECT_EQ(roundTrip("ay", data), Value(data));
  EXPECT_EQ(roundTrip("(d)", Date{-2.5}), Value(Date{-2.5}));
  EXPECT_EQ(roundTrip("ax", Array{1, 2.0, -3}), Value(Array{1, 2, -3}));
  EXPECT_EQ(roundTrip("a(d)", Array{Date{1}}), Value(Array{Date{1}}));
  EXPECT_EQ(roundTrip("aax", Array{Array{}, Array{1}}), Value(Array{Array{}, Array{1}}));
  EXPECT_EQ(roundTrip("a{sas}", Dictionary{{"k", Array{"v"}}}),
            Value(Dictionary{{"k", Array{"v"}}}));
  EXPECT_EQ(roundTrip("ay", Array{1, 2}), Value(Data(asBytes("\x01\x02"))));
}

TEST(FrameWriterTest, NumbersTakeTheTypeAskedForAndItsNearestEnd) {
  EXPECT_EQ(roundTrip("y", 300).toInt64(), 255);
  EXPECT_EQ(roundTrip("n", -1e9).toInt64(), -32768);
  EXPECT_EQ(roundTrip("q", -1).toInt64(), 0);
  EXPECT_EQ(roundTrip("i", std::int64_t{1} << 40).toInt64(),
            std::numeric_limits<std::int32_t>::max());
  EXPECT_EQ(roundTrip("u", 2.9).toInt64(), 2);
  EXPECT_EQ(roundTrip("x", std::numeric_limits<std::uint64_t>::max()).toInt64(),
            std::numeric_limits<std::int64_t>::max());
  EXPECT_EQ(roundTrip("t", true).toUInt64(), 1U);
  EXPECT_EQ(roundTrip("d", 3).toDouble(), 3.0);
  EXPECT_EQ(roundTrip("q", 18).numberKind(), NumberKind::kUInt16);
}

TEST(FrameWriterTest, VariantsTakeTheNaturalType) {
  const StringConstant constant("a constant of this test");
  const auto signatureIn = [](const Value& value) {
    const Written written = writtenReply("v", value);
    const auto body = written.frame.body;
    return std::string(reinterpret_cast<const char*>(body.data()) + 1,
                       std::to_integer<std::size_t>(body[0]));
  };
  EXPECT_EQ(signatureIn(true), "b");
  EXPECT_EQ(signatureIn(std::uint8_t{1}), "y");
  EXPECT_EQ(signatureIn(std::int16_t{1}), "n");
  EXPECT_EQ(signatureIn(std::uint16_t{1}), "q");
  EXPECT_EQ(signatureIn(1), "i");
  EXPECT_EQ(signatureIn(1U), "u");
  EXPECT_EQ(signatureIn(std::int64_t{1}), "x");
  EXPECT_EQ(signatureIn(std::uint64_t{1}), "t");
  EXPECT_EQ(signatureIn(1.5F), "d");
  EXPECT_EQ(signatureIn(1.5), "d");
  EXPECT_EQ(signatureIn("text"), "s");
  EXPECT_EQ(signatureIn(constant), "s");
  EXPECT_EQ(signatureIn(Date{1}), "(d)");
  EXPECT_EQ(signatureIn(Data(asBytes("x"))), "ay");
  EXPECT_EQ(signatureIn(Dictionary{}), "a{sv}");
  EXPECT_EQ(signatureIn(Array{}), "av");
  EXPECT_EQ(signatureIn(Array{1, 2}), "ai");
  EXPECT_EQ(signatureIn(Array{1, 2.0}), "av");
  EXPECT_EQ(signatureIn(Array{Array{"a"}, Array{"b", "c"}}), "aas");
  EXPECT_EQ(signatureIn(Array{Array{"a"}, Array{1}}), "av");
  EXPECT_EQ(signatureIn(Array{Dictionary{}, Dictionary{{"a", 1}}}), "aa{sv}");
}

TEST(FrameWriterTest, ValuesInVariantsComeBackAsTheyWere) {
  Value deep = 1;
  for (int level = 0; level < 12; ++level) deep = Value(Array{deep});
  const Value values[] = {
      deep,
      Array{1, "two", Array{3.0, true}, Dictionary{{"k", Array{}}}},
      Dictionary{{"a", Dictionary{{"b", Array{Date{1}, Date{2}}}}}, {"c", std::nan("")}},
  };

  for (const Value& value : values) EXPECT_EQ(roundTrip("v", value), value) << describe(value);
}

TEST(FrameWriterTest, ValuesThatDoNotFitTheirTypeHaveNoForm) {
  EXPECT_FALSE(hasForm("v", Value()));
  EXPECT_FALSE(hasForm("b", "text"));
  EXPECT_FALSE(hasForm("x", "1"));
  EXPECT_FALSE(hasForm("s", 1));
  EXPECT_FALSE(hasForm("s", std::string_view("a\0b", 3)));
  EXPECT_FALSE(hasForm("s", "\xff"));
  EXPECT_FALSE(hasForm("o", "no path"));
  EXPECT_FALSE(hasForm("g", "a"));
  EXPECT_FALSE(hasForm("h", 1));
  EXPECT_FALSE(hasForm("(dd)", Array{1.0, 2.0}));
  EXPECT_FALSE(hasForm("(d)", 1.0));
  EXPECT_FALSE(hasForm("ay", "text"));
  EXPECT_FALSE(hasForm("ax", Array{1, "x"}));
  EXPECT_FALSE(hasForm("av", Array{Value()}));
  EXPECT_FALSE(hasForm("a{sv}", Array{}));
  EXPECT_FALSE(hasForm("a{iv}", Dictionary{}));
  EXPECT_FALSE(hasForm("a{sv}", Dictionary{{std::string_view("a\0", 2), 1}}));
  EXPECT_FALSE(hasForm("a{sv}", Dictionary{{"a", Value()}}));
  EXPECT_FALSE(hasForm("(", Array{}));
}

TEST(FrameWriterTest, NestingPastTheLimitHasNoForm) {
  const auto nested = [](unsigned arrays) {
    Value value = 1;
    for (unsigned level = 0; level < arrays; ++level) value = Value(Array{value, "other kind"});
    return value;
  };

  // Each array of mixed kinds counts as two levels: an array and a variant.
  EXPECT_TRUE(hasForm("v", nested(31)));
  EXPECT_FALSE(hasForm("v", nested(32)));
  EXPECT_FALSE(hasForm("v", nested(500)));
}

TEST(FrameWriterTest, ArraysOverTheLimitHaveNoForm) {
  const std::vector<std::byte> bytes(kMaxArrayBytes + 1);

  EXPECT_TRUE(hasForm("ay", Data(std::span(bytes).first(kMaxArrayBytes))));
  EXPECT_FALSE(hasForm("ay", Data(bytes)));
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus
