#include "client/WireValue.h"

#include <array>
#include <cmath>
#include <limits>
#include <string>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <systemd/sd-bus.h>

#include "client/PeerBus.h"

namespace halvox::client {
namespace {

using namespace std::string_literals;

// A message that is never sent: sd-bus makes messages for any bus, connected or not.
class WireValueTest : public testing::Test {
 protected:
  WireValueTest() {
    sd_bus_new(bus_.out());
    int unconnected[2];
    // sd-bus makes no messages for a bus that was never started.
    EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0, unconnected), 0);
    peer_.reset(unconnected[1]);
    sd_bus_set_fd(bus_.get(), unconnected[0], unconnected[0]);
    EXPECT_GE(sd_bus_start(bus_.get()), 0);
    EXPECT_GE(sd_bus_message_new_signal(bus_.get(), message_.out(), "/a", "a.b", "C"), 0);
  }

  std::optional<std::string> append(const Dictionary& dictionary) {
    return appendDictionary(message_.get(), dictionary);
  }
  sd_bus_message* sealed() {
    EXPECT_GE(sd_bus_message_seal(message_.get(), 1, 0), 0);
    EXPECT_GE(sd_bus_message_rewind(message_.get(), 1), 0);
    return message_.get();
  }
  std::optional<Value> thereAndBack(const Value& value) {
    EXPECT_EQ(append({{"value", value}}), std::nullopt);
    const auto dictionary = readValue(sealed());
    if (!dictionary) return std::nullopt;
    const Value* found = dictionary->dictionary().find("value");
    return found != nullptr ? std::optional(*found) : std::nullopt;
  }
  // The signature of the variant that holds the value of a dictionary's only entry.
  std::string signatureOf(const Value& value) {
    EXPECT_EQ(append({{"value", value}}), std::nullopt);
    sd_bus_message* message = sealed();
    const char* contents = nullptr;
    sd_bus_message_enter_container(message, 'a', "{sv}");
    sd_bus_message_enter_container(message, 'e', "sv");
    sd_bus_message_skip(message, "s");
    char type = 0;
    EXPECT_GT(sd_bus_message_peek_type(message, &type, &contents), 0);
    return contents != nullptr ? contents : "";
  }

  Bus bus_;
  platform::linux_::UniqueFd peer_;
  BusMessage message_;
};

struct SignatureCase {
  Value value;
  const char* signature;
};

class WireSignatureTest : public WireValueTest, public testing::WithParamInterface<int> {};

const std::array<SignatureCase, 14> kSignatures{{
    {true, "b"},
    {std::uint8_t{1}, "y"},
    {std::int16_t{-1}, "n"},
    {std::uint16_t{1}, "q"},
    {std::int32_t{-1}, "i"},
    {std::uint32_t{1}, "u"},
    {std::int64_t{-1}, "x"},
    {std::uint64_t{1}, "t"},
    {1.5F, "d"},
    {1.5, "d"},
    {"text", "s"},
    {platform::Date{1.5}, "(d)"},
    {platform::Data(std::as_bytes(std::span("xy", 2))), "ay"},
    {platform::Array{1, "two"}, "av"},
}};

TEST_P(WireSignatureTest, ValuesKeepTheirTypeOnTheWire) {
  const auto& expected = kSignatures.at(static_cast<std::size_t>(GetParam()));

  EXPECT_EQ(signatureOf(expected.value), expected.signature);
}

TEST_P(WireSignatureTest, ValuesComeBackEqual) {
  const auto& expected = kSignatures.at(static_cast<std::size_t>(GetParam()));

  EXPECT_EQ(thereAndBack(expected.value), expected.value);
}

INSTANTIATE_TEST_SUITE_P(AllKinds, WireSignatureTest,
                         testing::Range(0, static_cast<int>(kSignatures.size())));

TEST_F(WireValueTest, DictionariesNestAsTheyAre) {
  const Value nested = Dictionary{{"inner", Dictionary{{"deep", platform::Array{1, 2}}}}};

  EXPECT_EQ(signatureOf(nested), "a{sv}");
}

TEST_F(WireValueTest, ExtremesAndEmptyContainersComeBackEqual) {
  const Value value = Dictionary{
      {"least", std::numeric_limits<std::int64_t>::min()},
      {"most", std::numeric_limits<std::uint64_t>::max()},
      {"endless", std::numeric_limits<double>::infinity()},
      {"nan", std::nan("")},
      {"", "the empty key"},
      {"empty text", ""},
      {"empty list", platform::Array{}},
      {"empty dictionary", Dictionary{}},
      {"no bytes", platform::Data(std::span<const std::byte>())},
      {"umlaut \xC3\xA4", "\xF0\x9F\x8E\xA7"},
  };

  EXPECT_EQ(thereAndBack(value), value);
}

TEST_F(WireValueTest, TellsTheKeyOfAMissingValue) {
  const auto error = append({{"outer", Dictionary{{"list", platform::Array{1, Value()}}}}});

  ASSERT_TRUE(error);
  EXPECT_EQ(*error, "\"outer.list[1]\": there is no value");
}

TEST_F(WireValueTest, RefusesTextThatIsNotUtf8) {
  const auto error = append({{"name", "\xFF"}});

  ASSERT_TRUE(error);
  EXPECT_EQ(*error, "\"name\": the text is not UTF-8 without NUL");
}

Dictionary nest(int levels) {
  Dictionary dictionary{{"end", 1}};
  for (int level = 1; level < levels; ++level) dictionary = {{"d", dictionary}};
  return dictionary;
}

TEST_F(WireValueTest, NestingIsTakenUpToTheWiresLimit) {
  EXPECT_EQ(append(nest(32)), std::nullopt);  // 32 dictionaries and the variants in them
}

TEST_F(WireValueTest, NestingPastTheWiresLimitIsRefused) {
  const auto error = append(nest(33));

  ASSERT_TRUE(error);
  EXPECT_NE(error->find("nested too deep"), std::string::npos);
}

}  // namespace
}  // namespace halvox::client
