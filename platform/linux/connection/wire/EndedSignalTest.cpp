#include "platform/linux/connection/wire/EndedSignal.h"

#include <optional>
#include <span>
#include <string>
#include <variant>

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/FrameWriter.h"

namespace halvox::platform::linux_::dbus {
namespace {

constexpr std::string_view kPath = "/com/tarno/halvox/reporting";

std::optional<std::uint32_t> readBack(const std::string& bytes) {
  const auto frame = readFrame(std::as_bytes(std::span(bytes)));
  if (!std::holds_alternative<Frame>(frame)) return std::nullopt;
  return readEndedSignal(std::get<Frame>(frame));
}

std::string signal(std::string_view interface, std::string_view member, std::string_view signature,
                   const Value& argument) {
  std::string bytes;
  EXPECT_TRUE(
      appendSignal(bytes, 9, {{}, kPath, interface, member}, signature, std::span(&argument, 1)));
  return bytes;
}

TEST(EndedSignalTest, SaysTheLastRequest) {
  EXPECT_EQ(readBack(signal(kConnectionInterface, kEndedSignal, "u", Value(0xFEDCBA98U))),
            0xFEDCBA98U);
  EXPECT_EQ(readBack(signal(kConnectionInterface, kEndedSignal, "u", Value(0))), 0U);
}

TEST(EndedSignalTest, IsReadInTheOtherByteOrder) {
  const std::string number("\xFE\xDC\xBA\x98", 4);
  Frame frame;
  frame.header.type = MessageType::kSignal;
  frame.header.bigEndian = true;
  frame.header.interface = kConnectionInterface;
  frame.header.member = kEndedSignal;
  frame.header.signature = kEndedSignature;
  frame.body = std::as_bytes(std::span(number));

  EXPECT_EQ(readEndedSignal(frame), 0xFEDCBA98U);
}

TEST(EndedSignalTest, OtherMessagesSayNothing) {
  EXPECT_EQ(readBack(signal("com.tarno.halvox.Other", kEndedSignal, "u", Value(1))), std::nullopt);
  EXPECT_EQ(readBack(signal(kConnectionInterface, "Begun", "u", Value(1))), std::nullopt);
  EXPECT_EQ(readBack(signal(kConnectionInterface, kEndedSignal, "t", Value(1))), std::nullopt);
  std::string call;
  const Value argument(1);
  ASSERT_TRUE(appendMethodCall(call, 9, {{}, kPath, kConnectionInterface, kEndedSignal}, "u",
                               std::span(&argument, 1)));
  EXPECT_EQ(readBack(call), std::nullopt);
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus
