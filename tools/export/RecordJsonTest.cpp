#include "tools/export/RecordJson.h"

#include <limits>
#include <string>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

using namespace std::string_view_literals;

template <typename Write>
std::string jsonOf(Write write) {
  JsonBuffer buffer;
  JsonWriter writer(buffer);
  write(writer);
  return {buffer.GetString(), buffer.GetSize()};
}

TEST(RecordJsonTest, OneCompleteValueOnOneLineIsJson) {
  for (const std::string_view text : {"{}"sv, "{\"a\":[1,2.5e3,null,\"\\n\"]}"sv, "[]"sv, "1"sv}) {
    EXPECT_TRUE(isJsonOnOneLine(text)) << text;
  }
  for (const std::string_view text : {""sv, "{"sv, "{}{}"sv, "{\n}"sv, "{}\r"sv, "nil"sv,
                                      "{\"a\":1,}"sv, "{}\0{"sv, "{}\0"sv, "\"\xFF\""sv}) {
    EXPECT_FALSE(isJsonOnOneLine(text)) << text;
  }
}

TEST(RecordJsonTest, DeepNestingNeedsNoStack) {
  const std::string deep = std::string(1'000'000, '[') + std::string(1'000'000, ']');
  EXPECT_TRUE(isJsonOnOneLine(deep));
}

TEST(RecordJsonTest, TimesReadBackTheSame) {
  EXPECT_EQ(jsonOf([](JsonWriter& writer) { writeTime(writer, 0.1); }), "0.1");
  EXPECT_EQ(jsonOf([](JsonWriter& writer) { writeTime(writer, 1795374997.0606802); }),
            "1795374997.0606802");
  EXPECT_EQ(jsonOf([](JsonWriter& writer) {
              writeTime(writer, std::numeric_limits<double>::quiet_NaN());
            }),
            "null");
}

TEST(RecordJsonTest, TextThatIsNotUtf8IsReplaced) {
  EXPECT_EQ(jsonOf([](JsonWriter& writer) { writeText(writer, "a\xFF\"b"); }), "\"a\uFFFD\\\"b\"");
}

}  // namespace
}  // namespace halvox::tools
