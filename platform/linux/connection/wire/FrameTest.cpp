#include "platform/linux/connection/wire/Frame.h"

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/testdata/TestFrames.h"

namespace halvox::platform::linux_::dbus {
namespace {

using State = FrameMeasure::State;

constexpr std::size_t kNoLimit = kMaxMessageBytes;

std::string startOf(std::uint32_t bodyBytes, std::uint32_t fieldsBytes) {
  return WireBytes().raw("l").u8(1).u8(0).u8(1).u32(bodyBytes).u32(1).u32(fieldsBytes).bytes();
}

// Empty if the frame is accepted.
std::string errorOf(const std::string& frame) {
  const auto result = readFrame(asBytes(frame));
  const auto* error = std::get_if<WireError>(&result);
  return error == nullptr ? "" : error->message;
}

MessageHeader headerOf(const std::string& frame) {
  const auto result = readFrame(asBytes(frame));
  EXPECT_TRUE(std::holds_alternative<Frame>(result)) << errorOf(frame);
  return std::holds_alternative<Frame>(result) ? std::get<Frame>(result).header : MessageHeader{};
}

WireBytes textField(WireBytes fields, std::uint8_t code, std::string_view type,
                    std::string_view text) {
  return fields.align(8).u8(code).signature(type).text(text);
}

WireBytes numberField(WireBytes fields, std::uint8_t code, std::uint32_t number) {
  return fields.align(8).u8(code).signature("u").u32(number);
}

TEST(FrameMeasureTest, WrongFirstBytesAreReportedAsSoonAsTheyArrive) {
  EXPECT_EQ(measureFrame(asBytes("x"), kNoLimit).state, State::kBroken);
  EXPECT_EQ(measureFrame(asBytes({"l\0", 2}), kNoLimit).state, State::kBroken);
  EXPECT_EQ(measureFrame(asBytes({"l\1\0\2", 4}), kNoLimit).state, State::kBroken);
  EXPECT_EQ(measureFrame(asBytes({"l\1\0\2", 4}), kNoLimit).error.offset, 3U);
  EXPECT_EQ(measureFrame(asBytes({"l\1\0\1", 4}), kNoLimit).state, State::kNeedMoreBytes);
}

TEST(FrameMeasureTest, SizeIsThatOfHeaderPaddingAndBody) {
  EXPECT_EQ(measureFrame(asBytes(startOf(5, 9)), kNoLimit).totalBytes, 16U + 16 + 5);
  EXPECT_EQ(measureFrame(asBytes(startOf(0, 0)), kNoLimit).totalBytes, 16U);
}

TEST(FrameMeasureTest, SizesUpToTheLimitsAreKnownAndPastThemBroken) {
  const std::uint32_t arrayMax = kMaxArrayBytes;
  const std::uint32_t bodyMax = kMaxMessageBytes - 16;

  EXPECT_EQ(measureFrame(asBytes(startOf(0, arrayMax)), kNoLimit).state, State::kKnown);
  EXPECT_EQ(measureFrame(asBytes(startOf(0, arrayMax + 1)), kNoLimit).state, State::kBroken);
  EXPECT_EQ(measureFrame(asBytes(startOf(bodyMax, 0)), kNoLimit).state, State::kKnown);
  EXPECT_EQ(measureFrame(asBytes(startOf(bodyMax + 1, 0)), kNoLimit).state, State::kBroken);
  EXPECT_EQ(measureFrame(asBytes(startOf(0xffffffff, arrayMax)), SIZE_MAX).state, State::kBroken);
  EXPECT_EQ(measureFrame(asBytes(startOf(84, 0)), 100).state, State::kKnown);
  EXPECT_EQ(measureFrame(asBytes(startOf(85, 0)), 100).state, State::kBroken);
}

TEST(FrameTest, SmallestCallIsTaken) {
  const std::string frame = frameOf(1, callFields(""), "");

  const MessageHeader header = headerOf(frame);

  EXPECT_EQ(header.path, "/o");
  EXPECT_EQ(header.member, "m");
  EXPECT_EQ(header.serial, 1U);
}

TEST(FrameTest, SerialOfZeroIsRefused) {
  EXPECT_EQ(errorOf(frameOf(1, callFields(""), "", 0)), "the serial number must not be 0");
}

TEST(FrameTest, BytesAfterTheFrameAreRefused) {
  EXPECT_EQ(errorOf(frameOf(1, callFields(""), "") + "x"),
            "the frame has another size than its header says");
}

TEST(FrameTest, BodyWithoutASignatureIsRefused) {
  EXPECT_EQ(errorOf(frameOf(1, callFields(""), "x")), "the message has a body but no signature");
}

TEST(FrameTest, UnknownTypesAreReadSoThatTheyCanBeIgnored) {
  const std::string frame = frameOf(200, WireBytes(), "");

  const MessageHeader header = headerOf(frame);

  EXPECT_FALSE(isKnown(header.type));
  EXPECT_TRUE(isKnown(MessageType::kSignal));
}

TEST(FrameTest, EachTypeMustHaveItsFields) {
  const WireBytes none;
  const WireBytes reply = numberField(none, 5, 7);
  const WireBytes named = textField(none, 4, "s", "a.B");
  const WireBytes call = callFields("");
  const WireBytes signal = textField(call, 2, "s", "a.b");

  EXPECT_EQ(errorOf(frameOf(1, none, "")),
            "header field 1 (path): missing from a message of this type");
  EXPECT_EQ(errorOf(frameOf(1, textField(none, 1, "o", "/"), "")),
            "header field 3 (member): missing from a message of this type");
  EXPECT_EQ(errorOf(frameOf(2, none, "")),
            "header field 5 (reply serial): missing from a message of this type");
  EXPECT_EQ(errorOf(frameOf(3, reply, "")),
            "header field 4 (error name): missing from a message of this type");
  EXPECT_EQ(errorOf(frameOf(3, named, "")),
            "header field 5 (reply serial): missing from a message of this type");
  EXPECT_EQ(errorOf(frameOf(4, call, "")),
            "header field 2 (interface): missing from a message of this type");
  EXPECT_EQ(errorOf(frameOf(2, reply, "")), "");
  EXPECT_EQ(errorOf(frameOf(3, textField(reply, 4, "s", "a.B"), "")), "");
  EXPECT_EQ(errorOf(frameOf(4, signal, "")), "");
}

struct BadField {
  const char* what;
  WireBytes fields;
};

TEST(FrameTest, FieldsThatAreNotValidAreRefused) {
  const WireBytes call = callFields("");
  const std::string longName = "a." + std::string(254, 'b');
  const BadField cases[] = {
      {"interface without a dot", textField(call, 2, "s", "interface")},
      {"interface too long", textField(call, 2, "s", longName)},
      {"interface of the wrong type", textField(call, 2, "o", "/a")},
      {"interface that is never sent", textField(call, 2, "s", "org.freedesktop.DBus.Local")},
      {"error name with a digit first", textField(call, 4, "s", "a.1")},
      {"reply serial of 0", numberField(call, 5, 0)},
      {"reply serial of the wrong type", textField(call, 5, "s", "1")},
      {"empty destination", textField(call, 6, "s", "")},
      {"destination of one element", textField(call, 6, "s", "bus")},
      {"sender of one element", textField(call, 7, "s", ":1")},
      {"signature of the wrong type", textField(call, 8, "s", "u")},
      {"signature against the grammar",
       WireBytes(call).align(8).u8(8).signature("g").signature("a")},
      {"descriptors of the wrong type", textField(call, 9, "s", "1")},
      {"field 0", textField(call, 0, "s", "x")},
      {"member twice", textField(call, 3, "s", "n")},
      {"unknown field, signature against the grammar",
       numberField(call, 9, 1).align(8).u8(99).signature("(")},
      {"unknown field, bad text", textField(call, 99, "s", "\xff")},
      {"unknown field, bad boolean", WireBytes(call).align(8).u8(99).signature("b").u32(2)},
      {"unknown field that ends too early",
       WireBytes(call).align(8).u8(99).signature("at").u32(8).align(8).u32(0)},
  };

  for (const BadField& bad : cases) {
    EXPECT_NE(errorOf(frameOf(1, bad.fields, "")), "") << bad.what;
  }
}

TEST(FrameTest, PathsAndMembersThatAreNotValidAreRefused) {
  const auto callOf = [](std::string_view path, std::string_view member) {
    return frameOf(1, textField(textField(WireBytes(), 1, "o", path), 3, "s", member), "");
  };

  EXPECT_EQ(errorOf(callOf("/a", "b")), "");
  EXPECT_NE(errorOf(callOf("", "b")), "");
  EXPECT_NE(errorOf(callOf("/a/", "b")), "");
  EXPECT_NE(errorOf(callOf("/org/freedesktop/DBus/Local", "b")), "");
  EXPECT_NE(errorOf(callOf("/a", "")), "");
  EXPECT_NE(errorOf(callOf("/a", "b.c")), "");
}

TEST(FrameTest, UnknownFieldsOfAnyTypeAreSkipped) {
  WireBytes entry;
  entry.u32(7).signature("as").array(4, WireBytes().text("x").bytes());
  WireBytes element;
  element.u8(1).array(8, entry.bytes()).align(4).u32(3).signature("(xd)").align(8).u64(1).real(2);
  WireBytes fields = callFields("");
  fields.align(8).u8(99).signature("a(ya{uv}hv)").array(8, element.bytes());
  fields.align(8).u8(9).signature("u").u32(5);

  EXPECT_EQ(headerOf(frameOf(1, fields, "")).unixFds, 5U);
}

TEST(FrameTest, UnknownFieldThatNestsPastTheLimitIsRefused) {
  for (const unsigned levels : {kMaxNesting, kMaxNesting + 1}) {
    WireBytes fields = callFields("");
    fields.align(8).u8(99);
    for (unsigned level = 0; level < levels; ++level) fields.signature("v");
    fields.signature("y").u8(1);

    EXPECT_EQ(errorOf(frameOf(1, fields, "")).empty(), levels == kMaxNesting);
  }
}

TEST(FrameTest, PaddingThatIsNotZeroIsRefused) {
  const std::string sound = frameOf(1, callFields(""), "");
  // The first field is a path of two characters; one byte of padding follows its NUL. The second
  // field ends two bytes after a multiple of 8.
  std::string betweenFields = sound;
  betweenFields[16 + 11] = 'x';
  std::string afterFields = sound;
  afterFields.back() = 'x';

  EXPECT_EQ(errorOf(sound), "");
  EXPECT_NE(errorOf(betweenFields), "");
  EXPECT_EQ(errorOf(afterFields), "the padding after the header is not zero");
}

TEST(FrameTest, ErrorNamesTheByte) {
  const auto result = readFrame(asBytes(frameOf(1, textField(callFields(""), 6, "s", "x"), "")));

  ASSERT_TRUE(std::holds_alternative<WireError>(result));
  const auto& error = std::get<WireError>(result);
  EXPECT_EQ(error.message, "header field 6 (destination): invalid name");
  EXPECT_EQ(error.offset, 16U + 32 + 10);
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus
