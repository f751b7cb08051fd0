#include "platform/linux/connection/wire/Names.h"

#include <string>

#include <gtest/gtest.h>

#include "platform/linux/connection/wire/Signature.h"

namespace halvox::platform::linux_::dbus {
namespace {

TEST(NamesTest, ObjectPaths) {
  for (const char* good : {"/", "/a", "/a/b", "/_/0/Z9"}) EXPECT_TRUE(isObjectPath(good)) << good;
  for (const char* bad : {"", "a", "//", "/a/", "/a//b", "/a-b", "/a.b", "/\xc3\xa4", "/a b"}) {
    EXPECT_FALSE(isObjectPath(bad)) << bad;
  }
}

TEST(NamesTest, InterfaceNames) {
  for (const char* good : {"a.b", "_.b2", "com.tarno.A_b"})
    EXPECT_TRUE(isInterfaceName(good)) << good;
  for (const char* bad : {"", "a", ".a", "a.", "a..b", "a.2", "a-b.c", ":1.2", "a.b c"}) {
    EXPECT_FALSE(isInterfaceName(bad)) << bad;
  }
}

TEST(NamesTest, MemberNames) {
  for (const char* good : {"a", "_", "B2"}) EXPECT_TRUE(isMemberName(good)) << good;
  for (const char* bad : {"", "a.b", "2a", "a-b"}) EXPECT_FALSE(isMemberName(bad)) << bad;
}

TEST(NamesTest, BusNames) {
  for (const char* good : {"a.b", "a-b.c", "-a._b", ":1.2", ":a.b-c"}) {
    EXPECT_TRUE(isBusName(good)) << good;
  }
  for (const char* bad : {"", "a", "a.2", ":", ":1", ":1.", "a:b.c", "a..b"}) {
    EXPECT_FALSE(isBusName(bad)) << bad;
  }
}

TEST(NamesTest, NamesHaveAtMost255Bytes) {
  const std::string longest = "a." + std::string(253, 'b');

  EXPECT_TRUE(isInterfaceName(longest));
  EXPECT_TRUE(isBusName(longest));
  EXPECT_TRUE(isMemberName(std::string(255, 'b')));
  EXPECT_FALSE(isInterfaceName(longest + "b"));
  EXPECT_FALSE(isBusName(longest + "b"));
  EXPECT_FALSE(isMemberName(std::string(256, 'b')));
}

TEST(SignatureTest, ShapesOfTypes) {
  for (const char* taken : {"y", "v", "ay", "(d)", "a{sv}", "a{sa(d)}", "aax", "a{saas}"}) {
    EXPECT_EQ(shapeOfType(taken), SignatureShape::kTaken) << taken;
  }
  for (const char* known : {"h", "(s)", "(dd)", "((d))", "a{iv}", "a{os}", "a{sh}", "a(yv)"}) {
    EXPECT_EQ(shapeOfType(known), SignatureShape::kUnsupported) << known;
  }
  for (const char* bad :
       {"",     "a",      "()", "(",       "(y", ")", "yy", "{sv}", "a{sv", "a{vs}",
        "a{s}", "a{svv}", "aa", "a{(y)s}", "r",  "e", "*",  "m",    "(d))", "y\xff"}) {
    EXPECT_EQ(shapeOfType(bad), SignatureShape::kBroken) << bad;
  }
}

TEST(SignatureTest, ArraysAndStructsNestThirtyTwoDeep) {
  const auto arrays = [](std::size_t count) { return std::string(count, 'a') + "y"; };
  const auto structs = [](std::size_t count) {
    return std::string(count, '(') + "y" + std::string(count, ')');
  };

  EXPECT_EQ(shapeOfType(arrays(32)), SignatureShape::kTaken);
  EXPECT_EQ(shapeOfType(arrays(33)), SignatureShape::kTooDeep);
  EXPECT_EQ(shapeOfType(structs(32)), SignatureShape::kUnsupported);
  EXPECT_EQ(shapeOfType(structs(33)), SignatureShape::kTooDeep);
  EXPECT_FALSE(isSignature(arrays(33)));
}

TEST(SignatureTest, SignaturesAreOfAnyNumberOfTypesAndAtMost255Bytes) {
  EXPECT_EQ(shapeOfSignature(""), SignatureShape::kTaken);
  EXPECT_EQ(shapeOfSignature("a{sv}uqaax"), SignatureShape::kTaken);
  EXPECT_EQ(shapeOfSignature("xh"), SignatureShape::kUnsupported);
  EXPECT_EQ(shapeOfSignature("xa"), SignatureShape::kBroken);
  EXPECT_TRUE(isSignature(std::string(255, 'y')));
  EXPECT_FALSE(isSignature(std::string(256, 'y')));
}

TEST(SignatureTest, FirstTypeEndsWhereItIsComplete) {
  EXPECT_EQ(firstTypeLength("a{sv}uqaax"), 5U);
  EXPECT_EQ(firstTypeLength("aaxu"), 3U);
  EXPECT_EQ(firstTypeLength("(d)y"), 3U);
  EXPECT_EQ(firstTypeLength("a(y(ss)a{s(d)})u"), 15U);
  EXPECT_EQ(firstTypeLength("uu"), 1U);
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus
