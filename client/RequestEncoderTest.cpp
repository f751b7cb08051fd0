#include "client/RequestEncoder.h"

#include <array>
#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <systemd/sd-bus.h>

#include "client/testing/BusValue.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::client {
namespace {

using namespace std::string_literals;
using platform::linux_::UniqueFd;
using platform::linux_::UniqueHandle;
using Bus = UniqueHandle<sd_bus*, sd_bus_close_unref>;
using BusMessage = UniqueHandle<sd_bus_message*, sd_bus_message_unref>;

// A fixture with an sd-bus server that reads the frames of the encoder.
class RequestEncoderTest : public testing::Test {
 protected:
  RequestEncoderTest() {
    int ends[2];
    EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0, ends), 0);
    peer_.reset(ends[1]);
    sd_id128_t id{};
    id.bytes[0] = 1;
    EXPECT_GE(sd_bus_new(bus_.out()), 0);
    EXPECT_GE(sd_bus_set_fd(bus_.get(), ends[0], ends[0]), 0);
    EXPECT_GE(sd_bus_set_server(bus_.get(), 1, id), 0);
    write("\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n"s);
    EXPECT_GE(sd_bus_start(bus_.get()), 0);
    while (sd_bus_is_ready(bus_.get()) == 0) {
      if (sd_bus_process(bus_.get(), nullptr) < 0) break;
    }
  }

  void write(const std::string& bytes) {
    EXPECT_EQ(::write(peer_.get(), bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
  }
  // Returns the message that sd-bus reads from a frame.
  sd_bus_message* read(Request request) {
    auto* frame = std::get_if<std::string>(&request);
    EXPECT_NE(frame, nullptr);
    if (frame == nullptr) return nullptr;
    setSerial(frame->data(), 7);
    write(*frame);
    while (!message_ && sd_bus_process(bus_.get(), message_.out()) >= 0) {
    }
    return message_.get();
  }
  static Request messageWith(const Value& value) {
    const Dictionary dictionary{{"value", value}};
    return makeRequest(MessageView{std::nullopt, dictionary, 4, 1});
  }
  static std::optional<std::string> errorOf(const Dictionary& dictionary) {
    const Request request = makeRequest(MessageView{std::nullopt, dictionary, 4, 1});
    const auto* failure = std::get_if<Failure>(&request);
    return failure != nullptr ? std::optional(failure->message) : std::nullopt;
  }
  std::optional<Value> thereAndBack(const Value& value) {
    const auto dictionary = readValue(read(messageWith(value)));
    if (!dictionary) return std::nullopt;
    const Value* found = dictionary->dictionary().find("value");
    return found != nullptr ? std::optional(*found) : std::nullopt;
  }
  // Returns the signature of the variant in a dictionary's only entry.
  std::string signatureOf(const Value& value) {
    sd_bus_message* message = read(messageWith(value));
    const char* contents = nullptr;
    sd_bus_message_enter_container(message, 'a', "{sv}");
    sd_bus_message_enter_container(message, 'e', "sv");
    sd_bus_message_skip(message, "s");
    char type = 0;
    EXPECT_GT(sd_bus_message_peek_type(message, &type, &contents), 0);
    return contents != nullptr ? contents : "";
  }

  Bus bus_;
  UniqueFd peer_;
  BusMessage message_;
};

// Provides a limited number of segments, each with space for one number of 8 bytes.
class SmallSegments final : public SegmentSource {
 public:
  explicit SmallSegments(std::size_t most) : most_(most), words_(most) {}
  Segment next() override {
    if (used_ == most_) return {};
    char* begin = reinterpret_cast<char*>(&words_[used_++]);
    return {begin, begin + sizeof(std::uint64_t)};
  }
  [[nodiscard]] std::string text(std::size_t size) const {
    return {reinterpret_cast<const char*>(words_.data()), size};
  }

 private:
  std::size_t most_;
  std::size_t used_ = 0;
  std::vector<std::uint64_t> words_;
};

struct SignatureCase {
  Value value;
  const char* signature;
};

class RequestEncoderValueTest : public RequestEncoderTest,
                                public testing::WithParamInterface<int> {};

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

TEST_P(RequestEncoderValueTest, ValuesKeepTheirTypeOnTheWire) {
  const auto& expected = kSignatures.at(static_cast<std::size_t>(GetParam()));

  EXPECT_EQ(signatureOf(expected.value), expected.signature);
}

TEST_P(RequestEncoderValueTest, ValuesComeBackEqual) {
  const auto& expected = kSignatures.at(static_cast<std::size_t>(GetParam()));

  EXPECT_EQ(thereAndBack(expected.value), expected.value);
}

TEST_P(RequestEncoderValueTest, SegmentsOfAnySizeGiveTheSameFrame) {
  const Value& value = kSignatures.at(static_cast<std::size_t>(GetParam())).value;
  const Dictionary dictionary{{"a key", 1}, {"value", value}, {"list", platform::Array{value}}};
  const std::vector<ReporterID> ids{7, 8};
  const MessageView view{ids, dictionary, 4, 1};
  SmallSegments segments(1000);
  SegmentWriter writer(segments);

  ASSERT_EQ(encodeBody(writer, view), EncodeOutcome::kDone);

  std::string header(kMessageHeaderBytes, '\0');
  putMessageHeader(header.data(), writer.position());
  EXPECT_EQ(header + segments.text(writer.position()), std::get<std::string>(makeRequest(view)));
}

INSTANTIATE_TEST_SUITE_P(AllKinds, RequestEncoderValueTest,
                         testing::Range(0, static_cast<int>(kSignatures.size())));

TEST_F(RequestEncoderTest, DictionariesNestAsTheyAre) {
  const Value nested = Dictionary{{"inner", Dictionary{{"deep", platform::Array{1, 2}}}}};

  EXPECT_EQ(signatureOf(nested), "a{sv}");
}

TEST_F(RequestEncoderTest, ExtremesAndEmptyContainersComeBackEqual) {
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

TEST_F(RequestEncoderTest, TellsTheKeyOfAMissingValue) {
  const auto error = errorOf({{"outer", Dictionary{{"list", platform::Array{1, Value()}}}}});

  ASSERT_TRUE(error);
  EXPECT_EQ(*error, "\"outer.list[1]\": there is no value");
}

TEST_F(RequestEncoderTest, RefusesTextThatIsNotUtf8) {
  const auto error = errorOf({{"name", "\xFF"}});

  ASSERT_TRUE(error);
  EXPECT_EQ(*error, "\"name\": the text is not UTF-8 without NUL");
}

Dictionary nest(int levels) {
  Dictionary dictionary{{"end", 1}};
  for (int level = 1; level < levels; ++level) dictionary = {{"d", dictionary}};
  return dictionary;
}

TEST_F(RequestEncoderTest, NestingIsTakenUpToTheWiresLimit) {
  EXPECT_EQ(errorOf(nest(32)), std::nullopt);  // 32 dictionaries and the variants in them
}

TEST_F(RequestEncoderTest, NestingPastTheWiresLimitIsRefused) {
  const auto error = errorOf(nest(33));

  ASSERT_TRUE(error);
  EXPECT_NE(error->find("nested too deep"), std::string::npos);
}

// Puts an invalid byte at every place of texts whose lengths are near the size of a word.
TEST_F(RequestEncoderTest, FindsNulsAndBytesThatAreNotUtf8AtAnyPlace) {
  for (std::size_t size = 1; size <= 20; ++size) {
    const std::string good(size, 'x');
    EXPECT_EQ(errorOf({{good, good}}), std::nullopt);
    for (std::size_t place = 0; place < size; ++place) {
      for (const char bad : {'\0', '\xFF', '\x80'}) {
        std::string text = good;
        text[place] = bad;
        EXPECT_TRUE(errorOf({{"key", text}})) << size << " " << place;
        EXPECT_TRUE(errorOf({{text, 1}})) << size << " " << place;
      }
    }
  }
}

TEST_F(RequestEncoderTest, SaysWhichElementOfWhichKeyHasNoForm) {
  const Dictionary inner{{"\xFF", 1}};
  const auto error = errorOf({{"list", platform::Array{1, inner}}});

  ASSERT_TRUE(error);
  EXPECT_EQ(*error, "\"list[1].\xFF\": the key is not UTF-8 without NUL");
}

TEST_F(RequestEncoderTest, AMessageNamesMethodCategoryTypeAndRecipients) {
  const std::vector<ReporterID> ids{7, -8};
  sd_bus_message* message = read(makeRequest(MessageView{ids, {}, 0x08000004, 17}));

  ASSERT_NE(message, nullptr);
  EXPECT_STREQ(sd_bus_message_get_path(message), "/com/tarno/halvox/reporting");
  EXPECT_STREQ(sd_bus_message_get_interface(message),
               "com.tarno.halvox.HVReportingServiceProtocol");
  EXPECT_STREQ(sd_bus_message_get_member(message), "sendMessage");
  EXPECT_STREQ(sd_bus_message_get_signature(message, 1), "a{sv}uqaax");
  EXPECT_EQ(readValue(message), Value(Dictionary{}));
  EXPECT_EQ(readValue(message), Value(0x08000004));
  EXPECT_EQ(readValue(message), Value(17));
  EXPECT_EQ(readValue(message), Value(platform::Array{Value(platform::Array{7, -8})}));
}

TEST_F(RequestEncoderTest, OperationsCarryTheirArguments) {
  sd_bus_message* message = read(makeRequest(SessionOperation{9, ServiceType{11}}));

  EXPECT_STREQ(sd_bus_message_get_member(message), "setServiceType");
  EXPECT_EQ(readValue(message), Value(11));
  EXPECT_EQ(readValue(message), Value(9));
}

TEST_F(RequestEncoderTest, AFrameWithoutAnswerSaysSo) {
  Request request = makeRequest(SessionOperation{9, StartSession{}});
  setNoReplyExpected(std::get<std::string>(request).data());

  EXPECT_EQ(sd_bus_message_get_expect_reply(read(std::move(request))), 0);
}

TEST_F(RequestEncoderTest, WritesNoMoreThanTheSegmentsHold) {
  const Dictionary dictionary{{"text", std::string(100, 'x')}, {"n", 1}};
  const MessageView view{std::nullopt, dictionary, 4, 1};
  const std::size_t needed =
      (std::get<std::string>(makeRequest(view)).size() - kMessageHeaderBytes + 7) / 8;

  for (std::size_t most = 0; most <= needed; ++most) {
    SmallSegments segments(most);
    SegmentWriter writer(segments);
    EXPECT_EQ(encodeBody(writer, view),
              most < needed ? EncodeOutcome::kNoRoom : EncodeOutcome::kDone);
  }
}

}  // namespace
}  // namespace halvox::client
