#include "client/ServiceStream.h"

#include <string>

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/FrameWriter.h"

namespace halvox::client {
namespace {

namespace dbus = platform::linux_::dbus;
using State = NextFrame::State;

NextFrame next(std::string_view bytes) { return nextFrame(std::as_bytes(std::span(bytes))); }

std::string reply(std::uint32_t to, std::string_view signature = "", const Value& value = {}) {
  std::string frame;
  EXPECT_TRUE(dbus::appendMethodReturn(frame, {to, {}}, 3, signature, value));
  return frame;
}

TEST(NextFrameTest, TellsWhichCallAnAnswerIsFor) {
  for (const std::string& frame : {reply(77), reply(77, "b", true), reply(77, "s", "text")}) {
    const NextFrame found = next(frame + "more");

    EXPECT_EQ(found.state, State::kAnswer);
    EXPECT_EQ(found.bytes, frame.size());
    EXPECT_EQ(found.answer.replySerial, 77U);
    EXPECT_FALSE(found.answer.isError);
  }
}

TEST(NextFrameTest, KnowsErrorsFromOtherAnswers) {
  std::string frame;
  ASSERT_TRUE(dbus::appendError(frame, {78, {}}, 3, "a.b", "refused"));

  const NextFrame found = next(frame);

  EXPECT_EQ(found.state, State::kAnswer);
  EXPECT_EQ(found.answer.replySerial, 78U);
  EXPECT_TRUE(found.answer.isError);
}

TEST(NextFrameTest, FindsTheNumberOfTheCallBehindOtherFields) {
  std::string frame;
  ASSERT_TRUE(dbus::appendMethodReturn(frame, {79, ":1.5"}, 3, "", {}));
  // Swaps the two fields of a frame's header.
  const std::string serialField = frame.substr(16, 8);
  frame.erase(16, 8);
  while (frame.size() % 8 != 0) frame += '\0';
  frame += serialField;
  frame[12] = static_cast<char>(frame.size() - 16);

  const NextFrame found = next(frame);

  EXPECT_EQ(found.state, State::kAnswer);
  EXPECT_EQ(found.answer.replySerial, 79U);
}

TEST(NextFrameTest, WaitsForTheRestOfAFrame) {
  const std::string frame = reply(77, "s", "text");

  for (std::size_t size = 0; size < frame.size(); ++size) {
    EXPECT_EQ(next(frame.substr(0, size)).state, State::kIncomplete) << size;
  }
}

TEST(NextFrameTest, IgnoresCalls) {
  std::string frame;
  ASSERT_TRUE(dbus::appendMethodCall(frame, 5, {"", "/a", "a.b", "C"}, "", {}));

  const NextFrame found = next(frame);

  EXPECT_EQ(found.state, State::kOther);
  EXPECT_EQ(found.bytes, frame.size());
}

TEST(NextFrameTest, RefusesWhatIsNotDBus) {
  std::string noSerial = reply(77);
  noSerial[20] = 0;

  EXPECT_EQ(next("HTTP/1.1 200 OK and more").state, State::kBroken);
  EXPECT_EQ(next(noSerial).state, State::kBroken);
}

}  // namespace
}  // namespace halvox::client
