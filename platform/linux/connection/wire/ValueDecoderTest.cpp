#include "platform/linux/connection/wire/ValueDecoder.h"

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/testdata/TestFrames.h"

namespace halvox::platform::linux_::dbus {
namespace {

using Kind = DecodeError::Kind;
using Values = std::vector<Value>;

std::optional<DecodeError> errorOf(std::string_view signature, const WireBytes& body) {
  Values arguments{"left over"};
  auto error = decodeBody(bodyFrame(signature, body), signature, arguments);
  EXPECT_TRUE(!error.has_value() || arguments.empty());
  return error;
}

Values valuesOf(std::string_view signature, const WireBytes& body) {
  Values arguments;
  const auto error = decodeBody(bodyFrame(signature, body), signature, arguments);
  EXPECT_FALSE(error.has_value()) << error->message;
  return arguments;
}

// Returns a dictionary a{sv} of one entry. The test writes the entry's value.
WireBytes entryOf(std::string_view key, std::string_view variantSignature,
                  const std::string& content) {
  WireBytes entry;
  entry.text(key).signature(variantSignature).raw(content);
  return WireBytes().array(8, entry.bytes());
}

void expectMalformed(const char* what, std::string_view signature, const WireBytes& body) {
  const auto error = errorOf(signature, body);
  ASSERT_TRUE(error.has_value()) << what;
  EXPECT_EQ(error->kind, Kind::kMalformed) << what;
  EXPECT_NE(error->message, "");
}

TEST(ValueDecoderTest, OtherSignaturesThanTheExpectedOneAreAnErrorOfTheirOwn) {
  Values arguments;

  const auto error = decodeBody(bodyFrame("x", WireBytes().u64(1)), "qx", arguments);

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->kind, Kind::kWrongSignature);
  EXPECT_EQ(error->message, "the arguments have the signature \"x\", expected \"qx\"");
}

TEST(ValueDecoderTest, LastOfEntriesWithOneKeyCounts) {
  WireBytes entries;
  entries.text("a").u8(1).align(8).text("b").u8(2).align(8).text("a").u8(3);

  const Values values = valuesOf("a{sy}", WireBytes().array(8, entries.bytes()));

  EXPECT_EQ(values, (Values{Dictionary{{"a", 3}, {"b", 2}}}));
}

TEST(ValueDecoderTest, UnsupportedValuesAreNamedWithKeyAndSignature) {
  const auto error = errorOf("a{sv}", entryOf("socket", "h", std::string(4, '\0')));

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->kind, Kind::kUnsupported);
  EXPECT_EQ(error->key, "argument 1, key \"socket\"");
  EXPECT_EQ(error->signature, "h");
  EXPECT_EQ(error->message,
            "argument 1, key \"socket\": values of this type are not supported "
            "(signature \"h\")");
}

TEST(ValueDecoderTest, PathOfKeysAndElementsIsReported) {
  // u, then {"a": {"b": [1, 2, 3, (4)]}}
  WireBytes array;
  for (int i = 0; i < 3; ++i) array.signature("y").u8(1);
  array.signature("(u)").align(8).u32(4);
  WireBytes inner;
  inner.text("b").signature("av").array(1, array.bytes());
  WireBytes outer;
  outer.text("a").signature("a{sv}").array(8, inner.bytes());
  WireBytes body;
  body.u32(1).array(8, outer.bytes());

  const auto error = errorOf("ua{sv}", body);

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->kind, Kind::kUnsupported) << error->message;
  EXPECT_EQ(error->key, "argument 2, key \"a\".\"b\"[3]");
  EXPECT_EQ(error->signature, "(u)");
}

TEST(ValueDecoderTest, PathWithoutKeysIsOfElements) {
  WireBytes inner;
  inner.array(4, WireBytes().text("\xff").bytes());
  WireBytes body;
  body.array(4, WireBytes().u32(0).raw(inner.bytes()).bytes());

  const auto error = errorOf("aas", body);

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->key, "argument 1, element [1][0]");
  EXPECT_EQ(error->signature, "s");
}

TEST(ValueDecoderTest, KeysInErrorsAreEscapedAndCut) {
  const std::string key = "line\n\"quoted\"" + std::string(100, 'x');

  const auto error = errorOf("a{sv}", entryOf(key, "h", std::string(4, '\0')));

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->key.substr(0, 45), "argument 1, key \"line\\x0a\\\"quoted\\\"xxxxxxxxxx");
  EXPECT_LT(error->key.size(), 110U);
  EXPECT_EQ(error->key.find('\n'), std::string::npos);
}

TEST(ValueDecoderTest, UnsupportedTypesAreRefusedEvenInEmptyArrays) {
  for (const char* type : {"ah", "a(yy)", "a{iv}", "a{ov}"}) {
    WireBytes content;
    content.align(4).u32(0);
    WireBytes entry;
    entry.text("k").signature(type).align(4).u32(0).align(alignof(std::uint64_t));

    const auto error = errorOf("a{sv}", WireBytes().array(8, entry.bytes()));

    ASSERT_TRUE(error.has_value()) << type;
    EXPECT_EQ(error->kind, Kind::kUnsupported) << type;
    EXPECT_EQ(error->signature, type);
  }
}

TEST(ValueDecoderTest, UnsupportedTypesAreRefusedAsArgumentsToo) {
  EXPECT_EQ(errorOf("h", WireBytes().u32(0))->kind, Kind::kUnsupported);
  EXPECT_EQ(errorOf("(yy)", WireBytes().u8(0).u8(0))->kind, Kind::kUnsupported);
  EXPECT_EQ(errorOf("a{uv}", WireBytes().u32(0))->kind, Kind::kUnsupported);
  EXPECT_EQ(errorOf("yh", WireBytes().u8(0).u32(0))->key, "argument 2");
}

TEST(ValueDecoderTest, VariantsNestToTheLimitAndAreUnsupportedPastIt) {
  for (const bool bigEndian : {false, true}) {
    for (const unsigned levels : {kMaxNesting, kMaxNesting + 1, 10'000U}) {
      WireBytes body(bigEndian);
      for (unsigned level = 1; level < levels; ++level) body.signature("v");
      body.signature("y").u8(7);

      const auto error = errorOf("v", body);

      EXPECT_EQ(error.has_value(), levels > kMaxNesting) << levels;
      EXPECT_TRUE(!error.has_value() || error->kind == Kind::kUnsupported);
    }
  }
}

// A dictionary a{sv} inside dictionaries, each under the key "k".
WireBytes nestedDictionaries(unsigned count) {
  std::string content;
  for (unsigned level = 0; level < count; ++level) {
    WireBytes entry;
    entry.text("k").signature(level == 0 ? "y" : "a{sv}");
    if (level == 0) {
      entry.u8(1);
    } else {
      entry.array(8, content);
    }
    content = entry.bytes();
  }
  return WireBytes().array(8, content);
}

TEST(ValueDecoderTest, DictionariesNestToTheLimitAndPastItTheirKeysAreNamed) {
  // Each level is an array and a variant.
  const auto sound = errorOf("a{sv}", nestedDictionaries(kMaxNesting / 2));
  const auto tooDeep = errorOf("a{sv}", nestedDictionaries(kMaxNesting / 2 + 1));

  EXPECT_FALSE(sound.has_value()) << sound->message;
  ASSERT_TRUE(tooDeep.has_value());
  EXPECT_EQ(tooDeep->kind, Kind::kUnsupported);
  EXPECT_EQ(tooDeep->signature, "a{sv}");
  EXPECT_TRUE(tooDeep->key.starts_with("argument 1, key \"k\".\"k\".\"k\""));
}

TEST(ValueDecoderTest, SignatureThatNestsTooDeepInAVariantIsUnsupported) {
  const auto error = errorOf("a{sv}", entryOf("k", std::string(33, 'a') + "y", std::string(4, 0)));

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->kind, Kind::kUnsupported);
  EXPECT_EQ(error->key, "argument 1, key \"k\"");
}

TEST(ValueDecoderTest, BrokenBasicValuesAreMalformed) {
  expectMalformed("boolean of 2", "b", WireBytes().u32(2));
  expectMalformed("boolean of 2^24", "b", WireBytes().u32(1U << 24));
  expectMalformed("text that is not UTF-8", "s", WireBytes().text("a\xc3"));
  expectMalformed("text with a NUL", "s", WireBytes().text({"a\0b", 3}));
  expectMalformed("text without an end", "s", WireBytes().u32(1).raw("ab"));
  expectMalformed("text of 4 GiB", "s", WireBytes().u32(0xffffffff).raw("ab"));
  expectMalformed("empty path", "o", WireBytes().text(""));
  expectMalformed("path with a slash too many", "o", WireBytes().text("/a/"));
  expectMalformed("signature against the grammar", "g", WireBytes().signature("a"));
  expectMalformed("bytes after the last argument", "y", WireBytes().u8(1).u8(1));
  expectMalformed("padding", "yu", WireBytes().raw({"\1\0\1\0\0\0\0\0", 8}));
}

TEST(ValueDecoderTest, BrokenContainersAreMalformed) {
  expectMalformed("array past the end", "ay", WireBytes().u32(2).u8(1));
  expectMalformed("array over 64 MiB", "ay", WireBytes().u32(kMaxArrayBytes + 1));
  expectMalformed("array that ends within an element", "au", WireBytes().u32(6).u32(0).u32(0));
  expectMalformed("array that ends within padding", "ax",
                  WireBytes().u32(12).align(8).u64(0).u64(0));
  expectMalformed("padding before the first element", "ax", WireBytes().u32(0).raw("xxxx"));
  expectMalformed("entry that ends after its key", "a{sy}",
                  WireBytes().array(8, WireBytes().text("k").bytes()));
  expectMalformed("key that is not UTF-8", "a{sy}",
                  WireBytes().array(8, WireBytes().text("\xff").u8(0).bytes()));
  expectMalformed(
      "padding before an entry", "a{sy}",
      WireBytes().array(8, WireBytes().text("k").u8(0).raw("x").text("k").u8(0).bytes()));
  expectMalformed("date cut off", "(d)", WireBytes().u32(0));
  expectMalformed("variant without a value", "v", WireBytes().signature("u"));
  expectMalformed("variant of no type", "v", WireBytes().signature(""));
  expectMalformed("variant of two types", "v", WireBytes().signature("yy").u8(0).u8(0));
  expectMalformed("variant against the grammar", "v", WireBytes().signature("a{vs}").u32(0));
  expectMalformed("variant signature without an end", "v", WireBytes().u8(1).raw("yy"));
}

TEST(ValueDecoderTest, MalformedMessagesNameTheByte) {
  const auto error =
      errorOf("a{sv}", entryOf("name", "s", WireBytes().u32(1).raw({"\xff\0", 2}).bytes()));

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->key, "argument 1, key \"name\"");
  EXPECT_EQ(error->message,
            "argument 1, key \"name\": the text is not valid UTF-8 or contains a NUL "
            "(signature \"s\", byte 26 of the body)");
}

TEST(ValueDecoderTest, OddBytesInBrokenSignaturesAreEscaped) {
  const auto error = errorOf("v", WireBytes().signature("\xff\n\""));

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->signature, "\\xff\\x0a\\\"");
}

TEST(ValueDecoderTest, ErrorLeavesNothingForTheNextMessage) {
  const WireBytes entry = entryOf("k", "h", std::string(4, '\0'));
  ASSERT_TRUE(errorOf("a{sv}", entry).has_value());

  const Values values =
      valuesOf("a{sy}", WireBytes().array(8, WireBytes().text("x").u8(1).bytes()));

  EXPECT_EQ(values, (Values{Dictionary{{"x", 1}}}));
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus
